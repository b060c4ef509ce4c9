#pragma once

#include <json/json.h>

#include <cstdint>
#include <optional>
#include <string>
#include <string_view>
#include <unordered_map>
#include <vector>

#include "programs/kestoelasticd/mapping.h"

/// How documents are laid out in a database. The letters, numbers and encodings here are on disk:
/// changing one needs a new format number in the index's marker file.
///
///   Q <digest of the id>            the document with that id
///   P <digest of a folder>          every document whose id continues behind "FOLDER/"
///   A <token>                       documents with that word in any field that is part of "_all"
///   F <number of field> <token>     documents with that token in the field
///   value 0                         the id
///   value 1 + number of field       a number, or the folded text of an n-gram field
namespace elasticd {

inline constexpr std::size_t kMaxTermSize = 245;
inline constexpr unsigned int kIdSlot = 0;

std::string IdTerm(std::string_view id);
/// The term of everything whose id begins with `folder` and "/".
std::string FolderTerm(std::string_view folder);
std::string AllTerm(std::string_view token);
std::string FieldPrefix(unsigned int number);
unsigned int FieldSlot(unsigned int number);

/// Shortens what exceeds the limit of a term to its beginning and a digest of the whole.
std::string FitTerm(std::string term);
/// Up to this size, the beginning of a term is never replaced by a digest.
inline constexpr std::size_t kKeptOfTerm = 200;

/// Texts that compare, byte by byte, as the numbers do.
std::string EncodeInt(std::int64_t number);
std::string EncodeDouble(double number);
/// A number, or a text that is one. None for anything else, and for what is out of range.
std::optional<std::int64_t> ReadInt(const Json::Value& value);
std::optional<double> ReadDouble(const Json::Value& value);
/// The value of a field of that numeric type: a number or its text. None when it does not fit.
std::optional<std::string> EncodeNumber(FieldType type, const Json::Value& value);

/// Numbers the fields of one index, so that a term spends a byte or two on its field. Numbers are
/// never reused. Kept in the database itself, and thus committed with the documents that use it.
class FieldTable {
  public:
    static constexpr std::size_t kMaxFields = 8192;
    static constexpr std::size_t kMaxNameSize = 256;

    /// Both are inverse. Load throws Error 1413 for anything that Save has not made.
    void Load(const std::string& text);
    std::string Save() const;

    std::optional<unsigned int> Find(const std::string& name) const;
    /// Throws Error 1409 when the name is too long or the table is full.
    unsigned int FindOrAdd(const std::string& name);
    const std::string& NameOf(unsigned int number) const { return names_.at(number); }
    std::size_t Size() const { return names_.size(); }

  private:
    std::vector<std::string> names_;
    std::unordered_map<std::string, unsigned int> numbers_;
};

}  // namespace elasticd
