#pragma once

#include <json/json.h>
#include <xapian.h>

#include <map>
#include <set>
#include <string>

#include "programs/kestoelasticd/mapping.h"
#include "programs/kestoelasticd/terms.h"

namespace elasticd {

struct ParsedQuery {
    Xapian::Query query;
    bool has_words = false;  ///< whether hits differ in relevance
    /// For highlights: the folded words asked for, by field ("_all" for every field).
    std::map<std::string, std::set<std::string>> words;
};

/// Builds the engine's query from a "qsl" form; see docs/search-daemon.md. The texts in it are
/// data: nothing in them is syntax. Throws Error 1410 for a form that cannot be followed, one
/// nested too deep or one with too many parts.
ParsedQuery ParseQuery(const Json::Value& qsl, const Mapping& mapping, const FieldTable& fields);

}  // namespace elasticd
