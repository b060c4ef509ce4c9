#include "programs/kestoelasticd/json_values.h"

#include <charconv>

#include "common/json.h"

namespace elasticd {
namespace {

void AppendEscaped(std::string& out, unsigned char c) {
    constexpr char kHex[] = "0123456789abcdef";
    switch (c) {
        case '"':
            out += "\\\"";
            break;
        case '\\':
            out += "\\\\";
            break;
        case '\n':
            out += "\\n";
            break;
        case '\t':
            out += "\\t";
            break;
        default:
            out += "\\u00";
            out += kHex[c >> 4];
            out += kHex[c & 0xf];
    }
}

std::string_view TextOf(const Json::Value& json) {
    const char* begin = nullptr;
    const char* end = nullptr;
    json.getString(&begin, &end);
    return {begin, static_cast<std::size_t>(end - begin)};
}

void CollectTexts(const Json::Value& json, std::vector<std::string>& texts) {
    if (json.isArray() || json.isObject()) {
        for (const Json::Value& element : json) {
            CollectTexts(element, texts);
        }
    } else if (!json.isNull()) {
        texts.push_back(json.asString());
    }
}

void AppendInt(std::string& out, std::int64_t number) {
    char digits[24];
    const auto result = std::to_chars(digits, digits + sizeof(digits), number);
    out.append(digits, result.ptr);
}

}  // namespace

engine::Value ToValue(const Json::Value& json) {
    if (json.isNull()) {
        return {};
    }
    if (json.isString()) {
        return std::string(TextOf(json));
    }
    if (json.isBool()) {
        return json.asBool();
    }
    if (json.isInt64() && json.type() != Json::realValue) {
        return static_cast<std::int64_t>(json.asInt64());
    }
    if (json.type() == Json::realValue) {
        return json.asDouble();
    }
    engine::Composite composite;
    AppendJson(composite.source, json);
    CollectTexts(json, composite.texts);
    return composite;
}

void AppendValue(std::string& out, const engine::Value& value) {
    if (const auto* text = std::get_if<std::string>(&value)) {
        AppendJsonText(out, *text);
    } else if (const auto* whole = std::get_if<std::int64_t>(&value)) {
        AppendInt(out, *whole);
    } else if (const auto* flag = std::get_if<bool>(&value)) {
        out += *flag ? "true" : "false";
    } else if (const auto* real = std::get_if<double>(&value)) {
        out += quivra::toString(Json::Value(*real));
    } else if (const auto* composite = std::get_if<engine::Composite>(&value)) {
        out += composite->source;
    } else {
        out += "null";
    }
}

void AppendJsonText(std::string& out, std::string_view text) {
    out += '"';
    std::size_t done = 0;
    for (std::size_t pos = 0; pos < text.size(); ++pos) {
        const auto c = static_cast<unsigned char>(text[pos]);
        if (c < 0x20 || c == '"' || c == '\\') {
            out.append(text, done, pos - done);
            AppendEscaped(out, c);
            done = pos + 1;
        }
    }
    out.append(text, done, text.size() - done);
    out += '"';
}

void AppendJson(std::string& out, const Json::Value& value) {
    if (value.isString()) {
        AppendJsonText(out, TextOf(value));
    } else if (value.isInt64() && value.type() != Json::realValue) {
        AppendInt(out, value.asInt64());
    } else {
        out += quivra::toString(value);
    }
}

}  // namespace elasticd
