#pragma once

#include <compare>
#include <cstdint>
#include <functional>
#include <optional>
#include <string>
#include <string_view>
#include <variant>
#include <vector>

#include "programs/kestoelasticd/engine/schema.h"

/// What documents hold. An engine stores values and gives them back as they were.
namespace elasticd::engine {

/// A list or a structure: a source that only the caller understands, and the texts in it.
struct Composite {
    std::string source;
    std::vector<std::string> texts;

    auto operator<=>(const Composite&) const = default;
};

/// monostate: no value; in a change it removes the field.
using Value = std::variant<std::monostate, bool, std::int64_t, double, std::string, Composite>;

inline bool IsNone(const Value& value) {
    return std::holds_alternative<std::monostate>(value);
}

struct Field {
    std::string name;
    Value value;
};

/// `fields` holds every field but the id's own.
struct Document {
    std::string id;
    std::vector<Field> fields;
};

/// Calls `take` for each text of the value; numbers and bools count as their texts.
void ForEachText(const Value& value, const std::function<void(std::string_view)>& take);

/// The value as a field of that numeric type holds it: an int64_t (kInt, kBool as 0 or 1) or a
/// double (kDouble). Texts of numbers are accepted. None when it does not fit.
std::optional<Value> ToNumber(FieldType type, const Value& value);

}  // namespace elasticd::engine
