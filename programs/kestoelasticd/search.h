#pragma once

#include <json/json.h>
#include <xapian.h>

#include <string>

#include "programs/kestoelasticd/mapping.h"
#include "programs/kestoelasticd/terms.h"

namespace elasticd {

/// What one query found, as the JSON text of the reply's members.
struct SearchResult {
    std::string data;  ///< an array of hits
    unsigned int total = 0;
};

/// Carries out {"qsl", "offset", "limit", "sort", "fields", "highlight"} on a database. Throws
/// Error 1410 for a query that cannot be followed, 1416 for a result that no reply can hold.
/// Exceptions of the engine pass: the caller knows which of them are worth a retry.
SearchResult Search(const Json::Value& query, const Mapping& mapping, const FieldTable& fields,
                    const Xapian::Database& database);

}  // namespace elasticd
