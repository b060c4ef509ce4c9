#include "programs/kestotifyd/state_server.h"

#include <sys/eventfd.h>

#include <chrono>
#include <cstdint>
#include <stdexcept>
#include <utility>

#include "common/error.h"
#include "common/json.h"

namespace kestotifyd {
namespace {

/// Longer than anybody waits for a reply. To close a connection earlier would look to the asker
/// like a daemon that ends, not like one that hangs.
constexpr std::chrono::seconds kLongestWait{5};

constexpr std::size_t kMaxRequest = 64U << 10;
constexpr std::size_t kMaxConnections = 16;

std::string Refuse(const std::string& message) {
    Json::Value reply;
    reply["success"] = false;
    reply["error"]["code"] = static_cast<int>(quivra::Error::kBadArgument);
    reply["error"]["msg"] = message;
    return quivra::toString(reply);
}

quivra::daemon::FrameServerOptions OptionsFor(const std::string& path) {
    quivra::daemon::FrameServerOptions options;
    options.path = path;
    options.max_request = kMaxRequest;
    options.max_buffered = kMaxRequest * kMaxConnections;
    options.max_connections = kMaxConnections;
    options.workers = 2;
    return options;
}

}  // namespace

StateServer::StateServer(const std::string& path)
    : asked_(eventfd(0, EFD_NONBLOCK | EFD_CLOEXEC)),
      server_(OptionsFor(path), [this](const std::string& request) { return Handle(request); }),
      thread_([this] { server_.Run(); }) {}

StateServer::~StateServer() {
    {
        // Whoever waits learns at once that there will be no reply.
        const std::lock_guard lock(mutex_);
        waiting_.clear();
    }
    server_.Stop();
    thread_.join();
}

std::string StateServer::Handle(const std::string& request) {
    Json::Value message;
    if (!quivra::fromString(message, request) || !message.isObject() ||
        message["type"] != "state") {
        return Refuse("Only {\"type\":\"state\"} is served here");
    }
    std::future<std::string> reply;
    {
        const std::lock_guard lock(mutex_);
        reply = waiting_.emplace_back().get_future();
    }
    eventfd_write(asked_.Get(), 1);
    if (reply.wait_for(kLongestWait) != std::future_status::ready) {
        throw std::runtime_error("the monitor's loop does not turn");
    }
    return reply.get();
}

void StateServer::Reply(const Json::Value& data) {
    eventfd_t count = 0;
    eventfd_read(asked_.Get(), &count);
    Json::Value reply;
    reply["success"] = true;
    reply["data"] = data;
    const std::string text = quivra::toString(reply);
    const std::lock_guard lock(mutex_);
    for (std::promise<std::string>& asker : std::exchange(waiting_, {})) {
        asker.set_value(text);
    }
}

}  // namespace kestotifyd
