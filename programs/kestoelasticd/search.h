#pragma once

#include <json/json.h>

#include <chrono>
#include <optional>
#include <set>
#include <string>

#include "programs/kestoelasticd/engine/engine.h"
#include "programs/kestoelasticd/highlight.h"
#include "programs/kestoelasticd/query.h"

namespace elasticd {

/// A query's "data" member, read: {"qsl", "offset", "limit", "sort", "after", "count", "timeout",
/// "fields", "highlight"}. Throws Error 1410 for what cannot be followed.
struct Search {
    Search(const Json::Value& query, const engine::Schema& schema);

    engine::SearchRequest request;
    bool with_id = true;
    bool with_text = false;  ///< asked for itself, not only for its highlight
    std::optional<std::set<std::string>> fields;
    std::map<std::string, AskedWords> highlighted;
    HighlightStyle style;
    std::chrono::milliseconds timeout{5000};

  private:
    void ReadSort(const Json::Value& sort);
    void ReadFields(const Json::Value& names, const engine::Schema& schema);
    void ReadHighlight(const Json::Value& highlight, ParsedQuery& parsed,
                       const engine::Schema& schema);
};

/// What one query found.
struct SearchResult {
    std::string reply;  ///< the JSON text of the whole reply: it may be large, so there is one copy
    std::uint64_t total = 0;
};

/// Carries it out. Throws Error 1416 for a result that no reply can hold, 1418 at the deadline, and
/// what the engine throws.
SearchResult RunSearch(const Search& search, const engine::Schema& schema, engine::Index& index);

}  // namespace elasticd
