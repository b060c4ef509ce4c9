#pragma once

#include <json/json.h>

#include <map>
#include <set>
#include <string>

#include "programs/kestoelasticd/engine/query.h"
#include "programs/kestoelasticd/engine/schema.h"

namespace elasticd {

/// Words that are looked for, folded, for highlights.
struct AskedWords {
    std::set<std::string> whole;
    std::set<std::string> beginnings;

    bool IsEmpty() const { return whole.empty() && beginnings.empty(); }
    void Merge(const AskedWords& other);
};

struct ParsedQuery {
    engine::Query query;
    bool has_words = false;  ///< whether hits differ in relevance
    /// By field; "_all" for every field.
    std::map<std::string, AskedWords> words;
};

/// Reads a "qsl" form; see docs/search-daemon.md. The texts in it are data: nothing in them is
/// syntax. Throws Error 1410 for a form that cannot be followed, one nested too deep or one with
/// too many parts.
ParsedQuery ParseQuery(const Json::Value& qsl, const engine::Schema& schema);

}  // namespace elasticd
