#pragma once

#include <array>
#include <string>
#include <utility>
#include <vector>

#include "programs/kestoelasticd/engine/sqlite/layout.h"
#include "programs/kestoelasticd/engine/sqlite/record.h"
#include "programs/kestoelasticd/engine/sqlite/tokens.h"
#include "programs/kestoelasticd/engine/value.h"

namespace elasticd::engine::sqlite {

/// What the full-text table is given for a document, column by column.
using Columns = std::array<ColumnText, kColumns>;

/// A document as the tables take it. Made before anything is written, so that a refusal does no
/// harm.
struct Encoded {
    Record record;
    Value text;  ///< of kTextField
    Columns columns;
    std::vector<std::pair<unsigned int, Value>> typed;  ///< number of field, int64/double/text
    std::size_t length = 0;                             ///< bytes that are searched as words
};

/// Throws Error 1409 where a value does not fit its field. Made from a record again, it gives the
/// same columns: that is how a document leaves the full-text table.
Encoded Encode(Record record, Value text, const FieldTable& fields);

/// A field's value as one text, for its typed column and for sorting: folded texts by lines.
std::string FoldedText(const Value& value);

}  // namespace elasticd::engine::sqlite
