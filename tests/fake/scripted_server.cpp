#include "tests/fake/scripted_server.h"

#include <poll.h>
#include <sys/eventfd.h>
#include <sys/socket.h>
#include <sys/un.h>
#include <unistd.h>

#include <cerrno>
#include <cstdint>
#include <cstring>
#include <deque>
#include <mutex>
#include <stdexcept>
#include <thread>

#include "common/json.h"
#include "common/unique_fd.h"

namespace fake {

using quivra::UniqueFd;

struct ScriptedServer::State {
    std::string path;
    UniqueFd listener;
    UniqueFd stop;
    std::thread thread;
    std::vector<UniqueFd> kept_open;  // the thread's own
    mutable std::mutex mutex;
    std::deque<Turn> turns;
    Handler handler;
    std::vector<std::string> texts;
    int connections = 0;

    void Run();
    void Serve(UniqueFd connection);
    bool WaitReadable(int fd) const;
    bool ReadBytes(int fd, std::size_t size, std::string& out) const;
    bool ReadRequest(int fd, std::string& text) const;
};

std::string Frame(const std::string& text) {
    const auto size = static_cast<std::uint32_t>(text.size());
    std::string bytes(sizeof(size), '\0');
    std::memcpy(bytes.data(), &size, sizeof(size));
    return bytes + text;
}

bool ScriptedServer::State::WaitReadable(int fd) const {
    pollfd fds[] = {{fd, POLLIN, 0}, {stop.Get(), POLLIN, 0}};
    while (poll(fds, 2, -1) < 0 && errno == EINTR) {
    }
    return fds[1].revents == 0;
}

bool ScriptedServer::State::ReadBytes(int fd, std::size_t size, std::string& out) const {
    out.clear();
    char buffer[65536];
    while (out.size() < size) {
        if (!WaitReadable(fd)) {
            return false;
        }
        const ssize_t got = recv(fd, buffer, std::min(sizeof(buffer), size - out.size()), 0);
        if (got <= 0) {
            return false;
        }
        out.append(buffer, static_cast<std::size_t>(got));
    }
    return true;
}

bool ScriptedServer::State::ReadRequest(int fd, std::string& text) const {
    std::uint32_t size = 0;
    if (!ReadBytes(fd, sizeof(size), text)) {
        return false;
    }
    std::memcpy(&size, text.data(), sizeof(size));
    return ReadBytes(fd, size, text);
}

void ScriptedServer::State::Serve(UniqueFd connection) {
    Turn turn;
    bool scripted = false;
    Handler answer;
    {
        const std::lock_guard lock(mutex);
        ++connections;
        scripted = !turns.empty();
        if (scripted) {
            turn = turns.front();
            turns.pop_front();
        }
        answer = handler;
    }
    std::string text;
    if (turn.read_request && ReadRequest(connection.Get(), text)) {
        {
            const std::lock_guard lock(mutex);
            texts.push_back(text);
        }
        Json::Value request;
        quivra::fromString(request, text);
        const std::string bytes = scripted ? turn.bytes : answer(request);
        // What does not fit is lost: the client has gone or reads no more.
        [[maybe_unused]] const ssize_t sent =
            send(connection.Get(), bytes.data(), bytes.size(), MSG_NOSIGNAL);
    }
    if (turn.keep_open) {
        kept_open.push_back(std::move(connection));
    }
}

void ScriptedServer::State::Run() {
    while (WaitReadable(listener.Get())) {
        UniqueFd connection(accept4(listener.Get(), nullptr, nullptr, SOCK_CLOEXEC));
        if (connection.IsValid()) {
            Serve(std::move(connection));
        }
    }
}

ScriptedServer::ScriptedServer(const std::string& path) : state_(std::make_unique<State>()) {
    State& state = *state_;
    state.path = path;
    state.handler = [](const Json::Value&) { return Frame(R"({"success":true})"); };
    state.stop = UniqueFd(eventfd(0, EFD_CLOEXEC));
    state.listener = UniqueFd(socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0));
    sockaddr_un address{};
    address.sun_family = AF_UNIX;
    std::strncpy(address.sun_path, path.c_str(), sizeof(address.sun_path) - 1);
    unlink(path.c_str());
    if (bind(state.listener.Get(), reinterpret_cast<const sockaddr*>(&address), sizeof(address)) !=
            0 ||
        listen(state.listener.Get(), 16) != 0) {
        throw std::runtime_error("cannot listen on " + path + ": " + std::strerror(errno));
    }
    state.thread = std::thread([&state] { state.Run(); });
}

ScriptedServer::~ScriptedServer() {
    eventfd_write(state_->stop.Get(), 1);
    state_->thread.join();
    unlink(state_->path.c_str());
}

void ScriptedServer::Then(Turn turn) {
    const std::lock_guard lock(state_->mutex);
    state_->turns.push_back(std::move(turn));
}

void ScriptedServer::SetHandler(Handler handler) {
    const std::lock_guard lock(state_->mutex);
    state_->handler = std::move(handler);
}

std::vector<std::string> ScriptedServer::RequestTexts() const {
    const std::lock_guard lock(state_->mutex);
    return state_->texts;
}

std::vector<Json::Value> ScriptedServer::Requests() const {
    std::vector<Json::Value> requests;
    for (const std::string& text : RequestTexts()) {
        quivra::fromString(requests.emplace_back(), text);
    }
    return requests;
}

int ScriptedServer::Connections() const {
    const std::lock_guard lock(state_->mutex);
    return state_->connections;
}

}  // namespace fake
