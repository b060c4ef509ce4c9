#include "programs/kestoelasticd/mapping.h"

#include <utility>

#include "common/error.h"
#include "programs/kestoelasticd/codes.h"

namespace elasticd {
namespace {

[[noreturn]] void Refuse(const std::string& what) {
    throw quivra::Error(kBadMapping, "Bad mapping: " + what);
}

std::string ReadName(const Json::Value& value, const std::string& what) {
    if (!value.isString()) {
        Refuse(what + " is no string");
    }
    return value.asString();
}

bool ReadFlag(const Json::Value& value, const std::string& what) {
    if (!value.isBool()) {
        Refuse(what + " is no bool");
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
        Refuse(what + " is no array");
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
        Refuse(field + " is no object");
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

Mapping::Mapping(const Json::Value& document) {
    if (!document.isObject()) {
        Refuse("no object");
    }
    id_field_ = ReadName(document["property_id"], "property_id");
    if (document.isMember("default")) {
        default_ = ReadSettings(default_, document["default"], "default");
    }
    const Json::Value& properties = document["properties"];
    if (!properties.isNull() && !properties.isObject()) {
        Refuse("properties is no object");
    }
    for (auto it = properties.begin(); it != properties.end(); ++it) {
        if (it.name().empty() || it.name() == kAllField) {
            Refuse("a field cannot be called \"" + it.name() + "\"");
        }
        listed_[it.name()] = ReadSettings(default_, *it, it.name());
    }
    const FieldSettings& id = Of(id_field_);
    if (id_field_.empty() || id.IsNumeric() || id.ngram || !id.stored ||
        id.analyzer != Analyzer::kKeyword) {
        Refuse("the field that identifies a document must be a stored keyword");
    }
    for (const auto& [field, settings] : listed_) {
        if (settings.required && field != id_field_) {
            required_.push_back(field);
        }
    }
}

const FieldSettings& Mapping::Of(const std::string& field) const {
    const auto found = listed_.find(field);
    return found == listed_.end() ? default_ : found->second;
}

}  // namespace elasticd
