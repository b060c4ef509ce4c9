#pragma once

#include <json/json.h>

#include <string>
#include <vector>

namespace quivra::ctl {

/// The search daemon's query for the words of a search. Blanks inside an argument separate words,
/// save inside double quotes. Every word has to match:
///   word            in the content, the metadata or a part of the file name
///   "two words"     the same for both together, whatever characters they hold
///   field:value     in one field, see FindField; an unknown field's name is part of the word
///   size:>10M       numbers and dates by comparison: > >= < <= or LOW..HIGH
///   -word           must not match; goes before each of the forms
/// Throws WrongCall when there is no word, or a field that holds numbers or dates gets a value
/// that is not one.
Json::Value MakeQuery(const std::vector<std::string>& arguments);

/// How a field's values are compared.
enum class FieldKind { kText, kExact, kNumber, kSize, kDate };

struct Field {
    std::string name;  ///< as documents have it, for example "KESTOMDTitle"
    FieldKind kind;
};

/// The field that a user calls so: a short name ("title", "size") or the field's own. False when
/// there is none.
bool FindField(Field& field, const std::string& name);

/// The short names of fields.
std::vector<std::string> ShortFieldNames();

/// The short names, with what they stand for, as lines for the help text.
std::string FieldHelp();

}  // namespace quivra::ctl
