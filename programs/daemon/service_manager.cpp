#include "programs/daemon/service_manager.h"

#include <sys/socket.h>
#include <sys/un.h>
#include <unistd.h>

#include <algorithm>
#include <cstddef>
#include <cstdlib>
#include <cstring>
#include <string>

#include "common/log.h"

namespace quivra::daemon {
namespace {

std::string TakeFromEnvironment(const char* name) {
    const char* value = getenv(name);
    const std::string text = value == nullptr ? "" : value;
    unsetenv(name);
    return text;
}

/// A socket connected to the address, which begins with "@" where it has no file.
base::UniqueFd ConnectDatagrams(const std::string& path) {
    sockaddr_un address{};
    address.sun_family = AF_UNIX;
    if (path.empty() || path.size() >= sizeof(address.sun_path)) {
        return base::UniqueFd();
    }
    std::memcpy(address.sun_path, path.data(), path.size());
    if (path.front() == '@') {
        address.sun_path[0] = '\0';
    }
    base::UniqueFd fd(socket(AF_UNIX, SOCK_DGRAM | SOCK_CLOEXEC | SOCK_NONBLOCK, 0));
    // The length tells where a name without a file ends.
    const auto size = static_cast<socklen_t>(offsetof(sockaddr_un, sun_path) + path.size());
    if (fd.IsValid() && connect(fd.Get(), reinterpret_cast<const sockaddr*>(&address), size) != 0) {
        LogError({"service_manager", __LINE__}, "Cannot tell the service manager on %s",
                 path.c_str());
        fd.Reset();
    }
    return fd;
}

}  // namespace

ServiceManager::ServiceManager() : socket_(ConnectDatagrams(TakeFromEnvironment("NOTIFY_SOCKET"))) {
    const std::string watched = TakeFromEnvironment("WATCHDOG_PID");
    const std::chrono::microseconds limit(
        std::strtoll(TakeFromEnvironment("WATCHDOG_USEC").c_str(), nullptr, 10));
    if (socket_.IsValid() && limit.count() > 0 &&
        (watched.empty() || watched == std::to_string(getpid()))) {
        // Half the time that is allowed, as systemd's own documentation advises.
        interval_ = limit / 2;
        next_beat_ = Clock::now();
    }
}

void ServiceManager::Turn(Clock::time_point now) {
    if (now >= next_beat_) {
        Send("WATCHDOG=1");
        next_beat_ = now + interval_;
    }
}

int ServiceManager::PollTimeout(Clock::time_point due, Clock::time_point now) const {
    due = std::min(due, next_beat_);
    if (due == Clock::time_point::max()) {
        return -1;
    }
    if (due <= now) {  // also time_point::min(), from which nothing can be subtracted
        return 0;
    }
    const auto left = std::chrono::ceil<std::chrono::milliseconds>(due - now).count();
    return static_cast<int>(std::min<std::int64_t>(left, 3'600'000));
}

void ServiceManager::Send(std::string_view state) const {
    if (socket_.IsValid()) {
        // When it does not listen there is nobody else to tell.
        [[maybe_unused]] const ssize_t sent =
            send(socket_.Get(), state.data(), state.size(), MSG_NOSIGNAL);
    }
}

}  // namespace quivra::daemon
