#include "programs/fileindexctl/search.h"

#include <algorithm>
#include <memory>
#include <utility>

#include "common/error.h"
#include "common/json.h"
#include "fileindex/elastic/elastic_control.h"
#include "fileindex/elastic/protocol.h"
#include "programs/fileindexctl/error_text.h"
#include "programs/fileindexctl/waiting.h"

namespace quivra::ctl {
namespace {

namespace field = fileindex::elastic::field;

/// Whether `a` comes before `b`. Hits without the field come last, whatever the direction.
bool ComesBefore(const Json::Value& a, const Json::Value& b, const SortOrder& order) {
    const Json::Value& x = a[order.field];
    const Json::Value& y = b[order.field];
    if (x.isNull() || y.isNull()) {
        return !x.isNull() && y.isNull();
    }
    const Json::Value& smaller = order.descending ? y : x;
    const Json::Value& larger = order.descending ? x : y;
    if (x.isNumeric() && y.isNumeric()) {
        return smaller.asDouble() < larger.asDouble();
    }
    return isJsonType<std::string>(x) && isJsonType<std::string>(y) &&
           smaller.asString() < larger.asString();
}

/// The hits of one share that are not in the merged list yet.
struct Rest {
    Json::Value hits;
    Json::ArrayIndex next = 0;

    const Json::Value& Front() const { return hits[next]; }
};

bool GoesFirst(const Rest& a, const Rest& b, const SortOrder& order) {
    return order.field.empty() ? a.next < b.next : ComesBefore(a.Front(), b.Front(), order);
}

/// The first `page.offset` are dropped, and no more than `page.limit` taken.
std::vector<Json::Value> Merge(std::vector<Rest>& rests, const Page& page, const SortOrder& order) {
    std::vector<Json::Value> merged;
    for (unsigned int i = 0; merged.size() < page.limit; ++i) {
        Rest* first = nullptr;
        for (Rest& rest : rests) {
            if (rest.next < rest.hits.size() &&
                (first == nullptr || GoesFirst(rest, *first, order))) {
                first = &rest;
            }
        }
        if (first == nullptr) {
            break;
        }
        Json::Value& hit = first->hits[first->next++];
        if (i >= page.offset) {
            merged.push_back(std::move(hit));
        }
    }
    return merged;
}

/// What each share is asked for: of several any may hold the whole page, or what comes before it.
Page PageOfEach(const Page& page, std::size_t shares) {
    if (shares == 1 || page.limit == Page::kNoLimit) {
        return {shares == 1 ? page.offset : 0, page.limit};
    }
    return {0, page.limit + std::min(page.offset, Page::kNoLimit - page.limit)};
}

Json::Value WithPage(Json::Value query, const Page& page) {
    if (page.offset > 0) {
        query["offset"] = page.offset;
    }
    if (page.limit != Page::kNoLimit) {
        query["limit"] = page.limit;
    }
    return query;
}

Rest SearchShare(const std::string& share, const Json::Value& query, SearchResults& results,
                 Session& session) {
    const auto shared_reply = std::make_shared<Json::Value>();
    WaitFor(session, Needs::kBothDaemons, [shared_reply, share, query] {
        fileindex::elastic::IndexQuery(*shared_reply, share, query);
    });
    Json::Value& reply = *shared_reply;
    if (!reply["data"].isArray() || !reply["total"].isUInt64()) {
        throw Error(Error::kQueryWithoutData, toString(reply));
    }
    results.total += reply["total"].asUInt64();
    return {std::move(reply["data"])};
}

}  // namespace

std::uint64_t CountDocuments(const std::string& share, const std::string& full_path) {
    Json::Value own(Json::objectValue);
    own["term"][field::kPath] = full_path;
    Json::Value below(Json::objectValue);
    below["prefix"][field::kPath] = full_path + "/";
    Json::Value query(Json::objectValue);
    query["qsl"]["any"].append(own);
    query["qsl"]["any"].append(below);
    query["limit"] = 0;
    Json::Value reply;
    fileindex::elastic::IndexQuery(reply, share, query);
    if (!reply["total"].isUInt64()) {
        throw Error(Error::kQueryWithoutData, toString(reply));
    }
    return reply["total"].asUInt64();
}

SearchResults SearchShares(const std::vector<std::string>& shares, const Json::Value& query,
                           const Page& page, const SortOrder& order, Session& session) {
    const Page page_of_each = PageOfEach(page, shares.size());
    const Json::Value paged = WithPage(query, page_of_each);
    SearchResults results;
    std::vector<Rest> rests;
    for (const std::string& share : shares) {
        session.doing = "search share " + share;
        try {
            rests.push_back(SearchShare(share, paged, results, session));
        } catch (const Error& error) {
            const bool was_last_hope = results.failures.size() + 1 == shares.size();
            if (was_last_hope || error.code == Error::kChannelFailed ||
                error.code == Error::kQueryWithoutData) {
                throw;
            }
            results.failures.push_back(DescribeError(session.doing, error));
        }
    }
    results.hits = Merge(rests, {page.offset - page_of_each.offset, page.limit}, order);
    return results;
}

}  // namespace quivra::ctl
