#include "programs/kestoelasticd/mapping.h"

#include <utility>

#include "common/error.h"
#include "programs/kestoelasticd/codes.h"

namespace elasticd {
namespace {

using engine::Analyzer;
using engine::FieldSettings;
using engine::FieldType;
using engine::kAllField;
using engine::kTextField;

[[noreturn]] void Refuse(const std::string& what) {
    throw quivra::Error(kBadMapping, "Bad mapping: " + what);
}

std::string ReadName(const Json::Value& value, const std::string& what) {
    if (!value.isString()) {
        Refuse(what + " is not a string");
    }
    return value.asString();
}

bool ReadFlag(const Json::Value& value, const std::string& what) {
    if (!value.isBool()) {
        Refuse(what + " is not a bool");
    }
    return value.asBool();
}

template <typename T>
T ReadChoice(const Json::Value& value, const std::string& what,
             std::initializer_list<std::pair<const char*, T>> choices) {
    const std::string name = ReadName(value, what);
    for (const auto& [text, choice] : choices) {
        if (name == text) {
            return choice;
        }
    }
    Refuse(what + " is unknown: " + name);
}

void ReadPreprocess(FieldSettings& settings, const Json::Value& value, const std::string& what) {
    if (!value.isArray()) {
        Refuse(what + " is not an array");
    }
    settings.fold = settings.ngram = false;
    for (const Json::Value& step : value) {
        const bool ngram = ReadChoice<bool>(step, what, {{"tolower", false}, {"ngram", true}});
        (ngram ? settings.ngram : settings.fold) = true;
    }
}

void ReadMember(FieldSettings& settings, const std::string& name, const Json::Value& value,
                const std::string& what) {
    if (name == "type") {
        settings.type = ReadChoice<FieldType>(value, what,
                                              {{"string", FieldType::kString},
                                               {"text", FieldType::kText},
                                               {"int", FieldType::kInt},
                                               {"double", FieldType::kDouble},
                                               {"bool", FieldType::kBool}});
    } else if (name == "analyzer") {
        settings.analyzer = ReadChoice<Analyzer>(value, what,
                                                 {{"keyword", Analyzer::kKeyword},
                                                  {"white space", Analyzer::kWhiteSpace},
                                                  {"kestostandard", Analyzer::kStandard}});
    } else if (name == "preprocess") {
        ReadPreprocess(settings, value, what);
    } else if (name == "required") {
        settings.required = ReadFlag(value, what);
    } else if (name == "stored") {
        settings.stored = ReadFlag(value, what);
    } else if (name == kAllField) {
        settings.in_all = ReadFlag(value, what);
    } else {
        Refuse(what + " is unknown");
    }
}

FieldSettings ReadSettings(FieldSettings settings, const Json::Value& members,
                           const std::string& field) {
    if (!members.isObject()) {
        Refuse(field + " is not an object");
    }
    for (auto it = members.begin(); it != members.end(); ++it) {
        ReadMember(settings, it.name(), *it, field + "." + it.name());
    }
    if (settings.ngram && settings.IsNumeric()) {
        Refuse(field + ": a number has no n-grams");
    }
    return settings;
}

}  // namespace

engine::Schema ReadMapping(const Json::Value& document) {
    if (!document.isObject()) {
        Refuse("not an object");
    }
    const std::string id_field = ReadName(document["property_id"], "property_id");
    FieldSettings otherwise;
    if (document.isMember("default")) {
        otherwise = ReadSettings(otherwise, document["default"], "default");
    }
    const Json::Value& properties = document["properties"];
    if (!properties.isNull() && !properties.isObject()) {
        Refuse("properties is not an object");
    }
    std::map<std::string, FieldSettings> listed;
    for (auto it = properties.begin(); it != properties.end(); ++it) {
        if (it.name().empty() || it.name() == kAllField) {
            Refuse("a field cannot be called \"" + it.name() + "\"");
        }
        listed[it.name()] = ReadSettings(otherwise, *it, it.name());
    }
    engine::Schema schema(id_field, otherwise, std::move(listed));
    const FieldSettings& id = schema.Of(id_field);
    if (id_field.empty() || !id.IsKeyword() || !id.stored) {
        Refuse("the field that identifies a document must be a stored keyword");
    }
    if (schema.Of(kTextField).IsNumeric()) {
        Refuse(std::string(kTextField) + " must be a text");
    }
    return schema;
}

}  // namespace elasticd
