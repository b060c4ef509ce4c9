#pragma once

#include <map>
#include <string>
#include <vector>

#include "programs/kestoelasticd/engine/engine.h"

namespace elasticd::engine {

/// An index as simple as can be: a map of documents, and each query put to each of them. The judge
/// of what an engine answers.
class Model {
  public:
    explicit Model(const Schema& schema) : schema_(schema) {}

    void Upsert(const Document& document);
    /// False when there is no such document.
    bool Set(const std::string& id, const std::string& new_id, const std::vector<Field>& changes);
    void Delete(const std::string& id) { documents.erase(id); }
    void DeleteMatching(const Query& query);

    bool Matches(const std::string& id, const Query& query) const;
    /// Ids that match, in order of their bytes.
    std::vector<std::string> Find(const Query& query) const;
    /// No value where the document lacks the field.
    Value ValueOf(const std::string& id, const std::string& field) const;

    using Fields = std::map<std::string, Value>;
    std::map<std::string, Fields> documents;

  private:
    bool MatchesText(const std::string& id, const Query& query) const;
    bool MatchesAllField(const std::string& id, const Query& query) const;
    bool StretchInAll(const std::string& id, std::string_view stretch) const;
    bool HasPhrase(const Value& value, std::string_view text, bool prefix) const;

    const Schema& schema_;
};

}  // namespace elasticd::engine
