#include "programs/kestotifyd/registration.h"

#include <sys/stat.h>

#include <algorithm>
#include <cerrno>
#include <filesystem>
#include <set>
#include <system_error>

#include "base/path.h"
#include "common/error.h"
#include "common/json.h"
#include "common/log.h"

namespace kestotifyd {
namespace {

using quivra::Error;

constexpr std::uintmax_t kMaxFileSize = 16U << 20;

std::string ReadPath(const Json::Value& value) {
    if (!value.isString() || !quivra::base::IsCanonicalText(value.asString())) {
        throw Error(Error::kBadArgument,
                    "Not a canonical absolute path" + quivra::AppendData(value));
    }
    return value.asString();
}

std::vector<std::string> ReadNames(const Json::Value& config) {
    Json::Value list(Json::arrayValue);
    quivra::GetJsonValue(list, config, "ignore", false);
    std::vector<std::string> names;
    for (const Json::Value& name : list.isArray() ? list : Json::Value(Json::arrayValue)) {
        if (!name.isString()) {
            throw Error(Error::kBadArgument, "Not a name" + quivra::AppendData(config));
        }
        names.push_back(name.asString());
    }
    return names;
}

std::string ReadLimited(const std::filesystem::path& path, Json::Value& description) {
    std::error_code error;
    if (!std::filesystem::is_regular_file(path, error)) {
        return "not a regular file";
    }
    if (std::filesystem::file_size(path, error) > kMaxFileSize) {
        return "too large";
    }
    return quivra::fromFile(description, path.string()) ? "" : "not readable as JSON";
}

}  // namespace

Registration ParseRegistration(const Json::Value& description) {
    Registration registration;
    Json::Value value;
    quivra::GetJsonValue(value, description, "queue", true);
    registration.queue = ReadPath(value);
    Json::Value config;
    quivra::GetJsonValue(config, description, "config", true);
    quivra::GetJsonValue(registration.mask, config, "mask", true);
    registration.ignore = ReadNames(config);
    quivra::GetJsonValue(value, config, "path", true);
    if (!value.isArray()) {
        throw Error(Error::kBadArgument, "Not an array" + quivra::AppendData(value));
    }
    std::set<std::string> seen;
    for (const Json::Value& element : value) {
        const std::string path = ReadPath(element);
        if (seen.insert(path).second) {
            registration.folders.push_back(path);
        }
    }
    return registration;
}

std::map<std::string, Registration> ReadRegistrations(const std::string& directory) {
    std::map<std::string, Registration> found;
    std::set<std::string> queues;
    std::vector<std::filesystem::path> files;
    std::error_code error;
    for (std::filesystem::directory_iterator it(directory, error), end; !error && it != end;
         it.increment(error)) {
        if (it->path().extension() == ".json" && it->path().filename().string().front() != '.') {
            files.push_back(it->path());
        }
    }
    std::sort(files.begin(), files.end());
    for (const std::filesystem::path& file : files) {
        Json::Value description;
        std::string problem = ReadLimited(file, description);
        try {
            if (problem.empty()) {
                Registration registration = ParseRegistration(description);
                if (queues.insert(registration.queue).second) {
                    found.emplace(file.filename().string(), std::move(registration));
                    continue;
                }
                problem = "another file registers the queue " + registration.queue;
            }
        } catch (const Error& malformed) {
            problem = malformed.reason;
        }
        errno = 0;
        quivra::LogError({"registration", __LINE__}, "Registration %s skipped: %s", file.c_str(),
                         problem.c_str());
    }
    return found;
}

}  // namespace kestotifyd
