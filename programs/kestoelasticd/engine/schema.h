#pragma once

#include <map>
#include <string>
#include <vector>

namespace elasticd::engine {

enum class FieldType { kString, kText, kInt, kDouble, kBool };
enum class Analyzer { kKeyword, kWhiteSpace, kStandard };

/// How one field is indexed.
struct FieldSettings {
    FieldType type = FieldType::kString;
    Analyzer analyzer = Analyzer::kStandard;
    bool fold = false;      ///< "tolower": a keyword is folded, too (words always are)
    bool ngram = false;     ///< every part of the value is found
    bool required = false;  ///< no document is without it
    bool stored = true;     ///< hits carry it
    bool in_all = true;     ///< part of "_all", the field that is searched by default

    bool IsNumeric() const { return type != FieldType::kString && type != FieldType::kText; }
    /// Whether the whole value is one term.
    bool IsKeyword() const { return !IsNumeric() && !ngram && analyzer == Analyzer::kKeyword; }
    /// Whether its words are searched one by one.
    bool HasWords() const { return !IsNumeric() && !ngram && !IsKeyword(); }
};

/// The field that holds a file's text: kept apart from the other fields, and part of a hit only
/// when it is asked for.
inline constexpr char kTextField[] = "KESTOMDTextContent";
/// The field that holds the directory of the id. Its value always is what the id says, whatever a
/// document was given: a directory that moves changes it for everything below.
inline constexpr char kParentField[] = "KESTOMDParent";
/// The name under which queries reach all fields that are part of it.
inline constexpr char kAllField[] = "_all";
/// Fields whose name begins so are stored and returned, and never searched.
inline constexpr char kUnsearchedPrefix = '@';

/// The settings of all fields. Immutable once made, so any number of threads may read it.
class Schema {
  public:
    Schema(std::string id_field, FieldSettings otherwise,
           std::map<std::string, FieldSettings> listed);

    /// The field that identifies a document.
    const std::string& IdField() const { return id_field_; }
    const FieldSettings& Of(const std::string& field) const;
    /// The fields, without the id's, that no document is without.
    const std::vector<std::string>& RequiredFields() const { return required_; }
    /// The fields that have settings of their own.
    const std::map<std::string, FieldSettings>& Listed() const { return listed_; }

  private:
    std::string id_field_;
    FieldSettings default_;
    std::map<std::string, FieldSettings> listed_;
    std::vector<std::string> required_;
};

}  // namespace elasticd::engine
