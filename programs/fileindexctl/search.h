#pragma once

#include <json/json.h>

#include <cstdint>
#include <limits>
#include <string>
#include <vector>

#include "programs/fileindexctl/session.h"

namespace quivra::ctl {

struct SortOrder {
    std::string field;  ///< empty: by relevance
    bool descending = false;
};

/// Which part of all hits is wanted.
struct Page {
    static constexpr unsigned int kNoLimit = std::numeric_limits<unsigned int>::max();

    unsigned int offset = 0;
    unsigned int limit = kNoLimit;
};

struct SearchResults {
    std::vector<Json::Value> hits;  ///< the page, as the search daemon gives them
    Json::UInt64 total = 0;
    std::vector<std::string> failures;  ///< a sentence for each share that was not searched
};

/// How many documents the share's index holds at and below the full path. Throws Error as
/// IndexQuery.
std::uint64_t CountDocuments(const std::string& share, const std::string& full_path);

/// Asks the index of each share and merges the replies into one list: by the sort field, hits
/// without it last; else the best of each share come first, then the second best, because relevance
/// is not a number that could be compared between indexes. `query` holds everything but offset and
/// limit.
///
/// A share whose index fails or is not there (yet) does not hide what the others hold. Throws the
/// Error when the search daemon is away (913), replies nonsense (916), or no share could be
/// searched.
SearchResults SearchShares(const std::vector<std::string>& shares, const Json::Value& query,
                           const Page& page, const SortOrder& order, Session& session);

}  // namespace quivra::ctl
