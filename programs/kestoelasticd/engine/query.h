#pragma once

#include <optional>
#include <string>
#include <vector>

#include "programs/kestoelasticd/engine/value.h"

namespace elasticd::engine {

/// A bound of a range.
struct Bound {
    Value number;  ///< an int64_t or a double
    bool inclusive = true;
};

/// What documents are asked for: a tree. Texts in it are data, nothing in them is syntax. What a
/// form matches is told for clients in docs/search-daemon.md.
struct Query {
    enum class Form {
        kAll,     ///< every part; everything where there are no parts
        kAny,     ///< at least one part
        kNot,     ///< not its one part
        kMatch,   ///< `text`'s words in `field`, all or (`any_word`) one of them
        kPhrase,  ///< `text`'s words in `field`, one after the other
        kPrefix,  ///< as kPhrase, the last word only beginning so; ids: byte by byte
        kTerm,    ///< exactly `value` in `field`
        kRange,   ///< the number in `field` lies within the bounds
        kBelow,   ///< ids below the directory `text`, itself only when `inclusive`
    };

    Form form = Form::kAll;
    std::string field;
    std::string text;
    Value value;
    bool any_word = false;
    bool inclusive = false;
    std::optional<Bound> lower;
    std::optional<Bound> upper;
    std::vector<Query> parts;
};

}  // namespace elasticd::engine
