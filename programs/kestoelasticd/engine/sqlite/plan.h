#pragma once

#include <cstdint>
#include <optional>
#include <string>
#include <vector>

#include "programs/kestoelasticd/engine/query.h"
#include "programs/kestoelasticd/engine/sqlite/layout.h"
#include "programs/kestoelasticd/engine/sqlite/tree.h"

namespace elasticd::engine::sqlite {

/// A query as it is carried out: as few and as large parts as the full-text table can answer by
/// itself, and what has to be put together with them.
struct Plan {
    enum class Kind {
        kEverything,
        kNothing,
        kNode,      ///< the document `node`
        kChildren,  ///< documents right in the directory `node`
        kWords,     ///< what matches `expression`
        kTyped,     ///< the typed column of `field` lies within the bounds
        kNames,     ///< children of `node` whose names begin with `name`, and all below them
        kBelow,     ///< documents below `node`
        kAll,
        kAny,
        kNot,
    };

    Kind kind = Kind::kNothing;
    std::int64_t node = 0;
    std::string name;
    bool itself = true;      ///< kNames, kBelow: also the named ones themselves
    std::string expression;  ///< of the full-text table
    int depth = 0;           ///< how deep the expression nests
    bool weighted = false;   ///< whether matching it makes a hit more relevant
    unsigned int field = 0;
    std::optional<Bound> lower;
    std::optional<Bound> upper;
    std::vector<Plan> parts;
};

/// Throws Error 1410 for what cannot be asked of a field.
Plan MakePlan(const Query& query, const FieldTable& fields, Tree& tree);

/// All that `plan` weighs, in one expression of the full-text table; empty where there is nothing.
std::string WeightedWords(const Plan& plan);

}  // namespace elasticd::engine::sqlite
