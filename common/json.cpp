#include "common/json.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <fstream>
#include <memory>
#include <sstream>

#include "base/unique_fd.h"
#include "common/util.h"

namespace quivra {
namespace {

Json::CharReader& Reader() {
    static thread_local const std::unique_ptr<Json::CharReader> reader = [] {
        Json::CharReaderBuilder builder;
        builder["collectComments"] = false;
        builder["failIfExtra"] = true;
        return std::unique_ptr<Json::CharReader>(builder.newCharReader());
    }();
    return *reader;
}

Json::StreamWriter& Writer() {
    static thread_local const std::unique_ptr<Json::StreamWriter> writer = [] {
        Json::StreamWriterBuilder builder;
        builder["indentation"] = "";
        builder["emitUTF8"] = true;
        return std::unique_ptr<Json::StreamWriter>(builder.newStreamWriter());
    }();
    return *writer;
}

bool SyncDirectory(const std::string& file_path) {
    const std::size_t slash = file_path.rfind('/');
    const std::string directory =
        slash == std::string::npos ? "." : file_path.substr(0, slash == 0 ? 1 : slash);
    const base::UniqueFd fd(open(directory.c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC));
    return fd.IsValid() && fsync(fd.Get()) == 0;
}

mode_t ModeForReplacement(const std::string& path) {
    struct stat status {};
    return stat(path.c_str(), &status) == 0 ? status.st_mode & 07777 : 0644;
}

bool WriteAside(const std::string& text, int fd, mode_t mode) {
    return WriteAll(fd, text.data(), text.size()) && fchmod(fd, mode) == 0 && fsync(fd) == 0;
}

}  // namespace

bool fromString(Json::Value& value, const std::string& text) {
    try {
        return Reader().parse(text.data(), text.data() + text.size(), &value, nullptr);
    } catch (const Json::Exception&) {
        return false;  // nested beyond the parser's limit
    }
}

std::string toString(const Json::Value& value) {
    std::ostringstream text;
    Writer().write(value, &text);
    return text.str();
}

bool fromFile(Json::Value& value, const std::string& path) {
    std::ifstream file(path, std::ios::binary);
    std::ostringstream text;
    return file && (text << file.rdbuf()) && fromString(value, text.str());
}

bool toFile(const Json::Value& value, const std::string& path) {
    std::string aside = path + ".XXXXXX";
    base::UniqueFd fd(mkostemp(aside.data(), O_CLOEXEC));
    if (!fd.IsValid()) {
        return false;
    }
    if (WriteAside(toString(value), fd.Get(), ModeForReplacement(path)) &&
        rename(aside.c_str(), path.c_str()) == 0) {
        return SyncDirectory(path);
    }
    const int saved_errno = errno;
    unlink(aside.c_str());
    errno = saved_errno;
    return false;
}

template <>
bool isJsonType<std::string>(const Json::Value& value) {
    return value.isConvertibleTo(Json::stringValue);
}
template <>
bool isJsonType<bool>(const Json::Value& value) {
    return value.isConvertibleTo(Json::booleanValue);
}
template <>
bool isJsonType<int>(const Json::Value& value) {
    return value.isConvertibleTo(Json::intValue);
}
template <>
bool isJsonType<unsigned int>(const Json::Value& value) {
    return value.isConvertibleTo(Json::uintValue);
}
template <>
bool isJsonType<long long>(const Json::Value& value) {
    return (value.type() == Json::intValue || value.type() == Json::uintValue) && value.isInt64();
}
template <>
bool isJsonType<double>(const Json::Value& value) {
    return value.isConvertibleTo(Json::realValue);
}

template <>
std::string asJsonType<std::string>(const Json::Value& value) {
    return value.asString();
}
template <>
bool asJsonType<bool>(const Json::Value& value) {
    return value.asBool();
}
template <>
int asJsonType<int>(const Json::Value& value) {
    return value.asInt();
}
template <>
unsigned int asJsonType<unsigned int>(const Json::Value& value) {
    return value.asUInt();
}
template <>
long long asJsonType<long long>(const Json::Value& value) {
    return value.asInt64();
}
template <>
double asJsonType<double>(const Json::Value& value) {
    return value.asDouble();
}

std::string AppendData(const Json::Value& data) {
    return ", data=" + toString(data);
}

const Json::Value* FindJsonMember(const Json::Value& json, const std::string& key, bool required) {
    if (!json.isObject()) {
        if (required) {
            throw Error(Error::kBadArgument, "Not an object" + AppendData(json));
        }
        return nullptr;
    }
    const Json::Value* member = json.find(key.data(), key.data() + key.size());
    if (member == nullptr && required) {
        throw Error(Error::kBadArgument, "Missing property: " + key + AppendData(json));
    }
    return member;
}

void GetJsonValue(Json::Value& out, const Json::Value& json, const std::string& key,
                  bool required) {
    const Json::Value* member = FindJsonMember(json, key, required);
    if (member != nullptr) {
        out = Json::Value(*member);  // `out` may be the document itself
    }
}

void JsonApplyChanges(Json::Value& target, const Json::Value& changes) {
    if (!target.isObject()) {
        target = Json::Value(Json::objectValue);
    }
    if (!changes.isObject()) {
        return;
    }
    for (auto it = changes.begin(); it != changes.end(); ++it) {
        const std::string key = it.name();
        if (it->isNull()) {
            target.removeMember(key);
        } else if (it->isObject()) {
            JsonApplyChanges(target[key], *it);
        } else {
            target[key] = *it;
        }
    }
}

}  // namespace quivra
