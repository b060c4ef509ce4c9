#include <fcntl.h>
#include <kesto/monitor_queue.h>
#include <sys/stat.h>
#include <unistd.h>

#include <array>
#include <cerrno>
#include <cstdint>
#include <cstdio>

#include "base/file.h"

namespace {

constexpr std::size_t kMaxStem = 200;  // leaves room for the suffixes within NAME_MAX

/// FNV-1a: told apart on disk, so it must be the same in every build.
std::uint64_t Hash(const std::string& text) {
    std::uint64_t hash = 0xcbf29ce484222325;
    for (const char c : text) {
        hash = (hash ^ static_cast<unsigned char>(c)) * 0x100000001b3;
    }
    return hash;
}

/// One file name per application and queue: readable where it fits, with a hash where it does not.
std::string FilePath(const std::string& queue_path, const std::string& app) {
    const std::string name = app + ":" + queue_path;
    std::string stem;
    for (const char c : name) {
        const auto byte = static_cast<unsigned char>(c);
        // Control characters would reach the terminal of whoever lists the directory.
        if (c != '/' && c != '%' && byte >= 0x20 && byte != 0x7f) {
            stem += c;
        } else {
            std::array<char, 4> code{};
            std::snprintf(code.data(), code.size(), "%%%02X", byte);
            stem += code.data();
        }
    }
    if (stem.size() > kMaxStem) {
        std::array<char, 18> hash{};
        std::snprintf(hash.data(), hash.size(), "~%016llx",
                      static_cast<unsigned long long>(Hash(stem)));
        stem = stem.substr(0, kMaxStem - hash.size()) + hash.data();
    }
    return std::string(KESTO_MONITOR_DIRECTORY) + "/" + stem + ".json";
}

bool MakeDirectories() {
    const int saved_errno = errno;
    if ((mkdir("/var/lib/kesto", 0755) != 0 && errno != EEXIST) ||
        (mkdir(KESTO_MONITOR_DIRECTORY, 0700) != 0 && errno != EEXIST)) {
        return false;
    }
    // The names in it are those of private folders. An installer may have made it with another
    // mode; where that cannot be changed, its owner has decided so.
    [[maybe_unused]] const int result = chmod(KESTO_MONITOR_DIRECTORY, 0700);
    errno = saved_errno;
    return true;
}

}  // namespace

namespace KESTO {
namespace KESTOTIFYD {

MonitorQueue::MonitorQueue(const Json::Value& description) : description_(description) {}

const Json::Value& MonitorQueue::Description() const {
    return description_;
}

bool MonitorQueue::Upsert(const MonitorQueue& queue, const std::string& app,
                          MonitorQueueType type) {
    const Json::Value& description = queue.description_;
    if (!description.isObject() || !description["queue"].isString() ||
        !description["config"].isObject()) {
        errno = EINVAL;
        return false;
    }
    Json::Value registration;
    registration["app"] = app;
    registration["type"] = type;
    registration["queue"] = description["queue"];
    registration["config"] = description["config"];
    Json::StreamWriterBuilder builder;
    builder["indentation"] = "";
    builder["emitUTF8"] = true;  // keeps the bytes of paths that are not valid UTF-8
    return MakeDirectories() &&
           quivra::base::ReplaceFile(FilePath(description["queue"].asString(), app),
                                     Json::writeString(builder, registration) + "\n",
                                     0600) == quivra::base::Replaced::kYes;
}

bool MonitorQueue::Delete(const std::string& queue_path, const std::string& app,
                          MonitorQueueType /*type*/) {
    const int saved_errno = errno;
    const bool is_gone = unlink(FilePath(queue_path, app).c_str()) == 0 || errno == ENOENT;
    errno = is_gone ? saved_errno : errno;
    return is_gone;
}

}  // namespace KESTOTIFYD
}  // namespace KESTO
