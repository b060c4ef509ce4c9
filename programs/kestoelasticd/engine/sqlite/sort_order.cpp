#include "programs/kestoelasticd/engine/sqlite/sort_order.h"

#include <sqlite3.h>

#include <algorithm>
#include <bit>

#include "programs/kestoelasticd/codes.h"

namespace elasticd::engine::sqlite {
namespace {

constexpr char kHasValue = '\0';
constexpr char kHasNone = '\1';

/// Big-endian, so that bytes compare as the numbers do.
void AppendOrdered(std::string& out, std::uint64_t number, bool descending) {
    number = descending ? ~number : number;
    for (int shift = 56; shift >= 0; shift -= 8) {
        out += static_cast<char>(number >> shift);
    }
}

constexpr std::uint64_t kSign = std::uint64_t{1} << 63;

std::uint64_t Ordered(std::int64_t number) {
    return static_cast<std::uint64_t>(number) ^ kSign;
}

std::uint64_t Ordered(double number) {
    const auto bits = std::bit_cast<std::uint64_t>(number + 0.0);  // -0.0 is 0.0
    return (bits & kSign) != 0 ? ~bits : bits | kSign;
}

}  // namespace

SortOrder::SortOrder(const std::vector<SortKey>& keys, ::sqlite::Database& database,
                     Documents& documents)
    : documents_(documents) {
    const FieldTable& fields = documents.Fields();
    std::string columns;
    for (const SortKey& wanted : keys) {
        if (wanted.field == kAllField || wanted.field == kTextField) {
            throw quivra::Error(kBadQuery, "Bad query: no sorting by " + wanted.field);
        }
        Key key;
        key.descending = wanted.descending;
        const std::optional<unsigned int> number = fields.Find(wanted.field);
        key.field = number.value_or(0);
        if (wanted.field == fields.GetSchema().IdField()) {
            key.source = Source::kId;
        } else if (wanted.field == kParentField) {
            key.source = Source::kParent;
        } else if (number && fields.Of(*number).typed) {
            key.source = Source::kTyped;
            key.column = static_cast<int>(typed_.size());
            typed_.push_back(*number);
            columns += (columns.empty() ? "" : ",") + TypedColumn(*number);
        } else if (number) {
            key.source = Source::kRecord;
        }
        keys_.push_back(key);
    }
    if (!columns.empty()) {
        typed_row_.emplace(database, "SELECT " + columns + " FROM docs WHERE id=?");
    }
}

std::optional<unsigned int> SortOrder::FirstTyped() const {
    return keys_.front().source == Source::kTyped ? std::optional(keys_.front().field)
                                                  : std::nullopt;
}

std::string SortOrder::KeyOf(std::int64_t id) {
    std::string out;
    if (typed_row_) {
        typed_row_->Reset();
        if (!typed_row_->Bind(1, id).Step()) {
            throw Damaged("the index lacks the row of document " + std::to_string(id));
        }
    }
    for (const Key& key : keys_) {
        std::optional<std::string> text;
        switch (key.source) {
            case Source::kTyped:
                AppendTyped(out, key);
                continue;
            case Source::kId:
                text = documents_.GetTree().PathOf(id);
                break;
            case Source::kParent:
                text = documents_.GetTree().PathOf(id);
                text->resize(std::min(text->rfind('/'), text->size()));
                break;
            case Source::kRecord:
                for (const auto& [number, value] :
                     documents_.ReadRecord(id, documents_.GetTree().PositionOf(id).second)) {
                    if (number == key.field) {
                        text = FoldedText(value);
                    }
                }
                break;
            case Source::kNowhere:
                break;
        }
        AppendText(out, text, key.descending);
    }
    if (typed_row_) {
        typed_row_->Reset();
    }
    AppendOrdered(out, Ordered(id), keys_.back().descending);
    return out;
}

void SortOrder::AppendTyped(std::string& out, const Key& key) {
    const int type = sqlite3_column_type(typed_row_->Handle(), key.column);
    if (type == SQLITE_INTEGER || type == SQLITE_FLOAT) {
        out += kHasValue;
        AppendOrdered(out,
                      type == SQLITE_INTEGER ? Ordered(typed_row_->Int(key.column))
                                             : Ordered(typed_row_->Double(key.column)),
                      key.descending);
    } else if (type == SQLITE_NULL) {
        out += kHasNone;
    } else {
        AppendText(out, std::string(typed_row_->Bytes(key.column)), key.descending);
    }
}

/// Ends each text with a mark below everything that may follow within one.
void SortOrder::AppendText(std::string& out, const std::optional<std::string>& text,
                           bool descending) {
    if (!text || text->empty()) {
        out += kHasNone;
        return;
    }
    out += kHasValue;
    const char flip = descending ? '\xff' : '\0';
    for (const char c : *text) {
        out += static_cast<char>(c ^ flip);
        if (c == '\0') {
            out += static_cast<char>('\xff' ^ flip);
        }
    }
    out += flip;
    out += flip;
}

}  // namespace elasticd::engine::sqlite
