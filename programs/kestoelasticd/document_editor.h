#pragma once

#include <json/json.h>
#include <xapian.h>

#include <functional>
#include <string>
#include <unordered_map>

#include "programs/kestoelasticd/mapping.h"
#include "programs/kestoelasticd/terms.h"

namespace elasticd {

/// Puts the terms and values of fields into a document, and takes them out again, following the
/// mapping. Knows nothing of databases: what is refused is refused before anything is written.
class DocumentEditor {
  public:
    /// All three outlive the editor.
    DocumentEditor(const Mapping& mapping, FieldTable& fields, Xapian::Document& document)
        : mapping_(mapping), fields_(fields), document_(document) {}

    void AddId(const std::string& id);
    /// Swaps the terms of one id for those of another.
    void ReplaceId(const std::string& old_id, const std::string& new_id);
    /// Throws Error 1409 when the value does not fit the field's type.
    void AddField(const std::string& name, const Json::Value& value);
    /// `old_value` is the one that AddField was given.
    void RemoveField(const std::string& name, const Json::Value& old_value);
    /// Writes what concerns several fields together. Call it once, at the end.
    void Finish();

  private:
    void AddNumber(const std::string& name, const FieldSettings& settings, unsigned int number,
                   const Json::Value& value);
    void AddText(const FieldSettings& settings, const std::string& prefix, const std::string& text,
                 unsigned int first_position);
    void AddGrams(const std::string& prefix, const std::string& folded);
    void CountAll(const std::string& text, int step);

    const Mapping& mapping_;
    FieldTable& fields_;
    Xapian::Document& document_;
    std::unordered_map<std::string, int> all_changes_;  ///< "_all" token -> more or fewer of it
};

/// The texts of a value: of a string or number its own, of an array or object those of its leaves.
void WalkTexts(const Json::Value& value, const std::function<void(const std::string&)>& take);

/// The text by which an n-gram field is found: its texts, folded, a line each.
std::string GramText(const Json::Value& value);

}  // namespace elasticd
