#pragma once

#include <cstdint>
#include <string>
#include <vector>

#include "programs/kestoelasticd/engine/sqlite/bitmap.h"
#include "programs/kestoelasticd/engine/sqlite/deadline.h"
#include "programs/kestoelasticd/engine/sqlite/layout.h"
#include "programs/kestoelasticd/engine/sqlite/lengths.h"

namespace elasticd::engine::sqlite {

/// A document and how well it fits. Better ones first, then lower numbers.
struct Ranked {
    float score = 0;
    std::int64_t id = 0;

    bool operator<(const Ranked& other) const {
        return score != other.score ? score > other.score : id < other.id;
    }
};

struct RankRequest {
    std::string words;              ///< an expression of the full-text table: what weighs
    const Bitmap* among = nullptr;  ///< only these; none: all that match `words`
    const Ranked* after = nullptr;  ///< only those that come behind this one
    std::size_t wanted = 0;         ///< so many of the best
};

struct RankResult {
    std::vector<Ranked> best;  ///< in order
    std::uint64_t matches = 0;
    Bitmap visited;  ///< where `among` is given: which of them `words` matches
};

/// Ranks by BM25, with the words of each field at the field's weight. One scan of the full-text
/// table, which reads no row of any other.
RankResult Rank(::sqlite::Database& database, const FieldTable& fields,
                const Lengths::View& lengths, const Deadline& deadline, const RankRequest& request);

}  // namespace elasticd::engine::sqlite
