#include "programs/kestotifyd/registration.h"

#include <dirent.h>
#include <fcntl.h>

#include <cerrno>
#include <memory>
#include <set>
#include <utility>

#include "base/file.h"
#include "base/path.h"
#include "common/error.h"
#include "common/json.h"
#include "common/log.h"
#include "programs/kestotifyd/backend.h"

namespace kestotifyd {
namespace {

using quivra::Error;

constexpr std::size_t kMaxFileSize = 16U << 20;

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

/// Why the file is no registration; empty when it is one.
std::string ReadOne(int directory, const std::string& name, Registration& registration) {
    const quivra::base::UniqueFd file = quivra::base::OpenRegular(directory, name, O_RDONLY);
    std::string text;
    if (!file.IsValid() || !quivra::base::ReadUpTo(file.Get(), kMaxFileSize + 1, text)) {
        return quivra::SystemErrorText(errno);
    }
    errno = 0;
    Json::Value description;
    if (text.size() > kMaxFileSize || !quivra::fromString(description, text)) {
        return "it is not JSON text of at most 16 MiB";
    }
    try {
        registration = ParseRegistration(description);
    } catch (const Error& malformed) {
        return malformed.reason;
    }
    return std::string();
}

/// False, with errno set, when the names are not all known.
bool ListFiles(int directory, std::set<std::string>& names) {
    const int fd = openat(directory, ".", O_RDONLY | O_DIRECTORY | O_CLOEXEC);
    const std::unique_ptr<DIR, int (*)(DIR*)> listing(fd < 0 ? nullptr : fdopendir(fd), closedir);
    if (!listing) {
        return false;
    }
    errno = 0;
    while (const dirent* const entry = readdir(listing.get())) {
        const std::string name = entry->d_name;
        if (name.front() != '.' && quivra::base::Extension(name) == "json") {
            names.insert(name);
        }
    }
    return errno == 0;
}

}  // namespace

/// Members that are not used ("app", "type") may be anything: they are the registering side's.
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

Registrations ReadRegistrations(const std::string& directory) {
    Registrations found;
    std::set<std::string> names;
    const quivra::base::UniqueFd fd(open(directory.c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC));
    if (!fd.IsValid() || !ListFiles(fd.Get(), names)) {
        found.problem = "Cannot read " + directory + ": " + quivra::SystemErrorText(errno);
        found.is_whole = false;
        return found;
    }
    // By name, so that of two files for one queue the same one counts each time.
    std::set<std::string> queues;
    for (const std::string& name : names) {
        Registration registration;
        std::string problem = ReadOne(fd.Get(), name, registration);
        found.is_whole &= problem.empty() || !IsShortage(errno);
        if (problem.empty() && !queues.insert(registration.queue).second) {
            problem = "another file registers the queue " + registration.queue;
        }
        if (problem.empty()) {
            found.list.push_back(std::move(registration));
            continue;
        }
        found.problem = "Registration " + directory + "/" + name + " skipped: " + problem;
        errno = 0;
        quivra::LogError({"registration", __LINE__}, "%s", found.problem.c_str());
    }
    return found;
}

}  // namespace kestotifyd
