#pragma once

#include <json/json.h>

#include <map>
#include <string>
#include <vector>

namespace elasticd {

enum class FieldType { kString, kText, kInt, kDouble, kBool };
enum class Analyzer { kKeyword, kWhiteSpace, kStandard };

/// How one field is indexed.
struct FieldSettings {
    FieldType type = FieldType::kString;
    Analyzer analyzer = Analyzer::kStandard;
    bool fold = false;      ///< "tolower": case and accents are folded before the analyzer
    bool ngram = false;     ///< every part of the value is found
    bool required = false;  ///< no document is without it
    bool stored = true;     ///< hits carry it
    bool in_all = true;     ///< part of "_all", the field that is searched by default

    bool IsNumeric() const { return type != FieldType::kString && type != FieldType::kText; }
    /// N-grams overlap, so places within them say nothing.
    bool HasPositions() const { return type == FieldType::kText && !ngram; }
};

/// The field that holds a file's text: kept apart from the other fields, and part of a hit only
/// when it is asked for.
inline constexpr char kTextField[] = "KESTOMDTextContent";
/// The name under which queries reach all fields that are part of it.
inline constexpr char kAllField[] = "_all";

/// A mapping document: {"property_id": NAME, "default": SETTINGS, "properties": {NAME: SETTINGS}}.
/// SETTINGS name what differs from the default: "type", "analyzer", "preprocess", "required",
/// "stored", "_all". Immutable, so any number of threads may read it.
class Mapping {
  public:
    /// Throws Error 1406 that names the offending part.
    explicit Mapping(const Json::Value& document);

    /// The field that identifies a document.
    const std::string& IdField() const { return id_field_; }
    const FieldSettings& Of(const std::string& field) const;
    const std::vector<std::string>& RequiredFields() const { return required_; }
    /// The fields that have settings of their own.
    const std::map<std::string, FieldSettings>& Listed() const { return listed_; }

  private:
    std::string id_field_;
    FieldSettings default_;
    std::map<std::string, FieldSettings> listed_;
    std::vector<std::string> required_;
};

}  // namespace elasticd
