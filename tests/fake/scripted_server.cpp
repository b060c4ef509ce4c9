#include "tests/fake/scripted_server.h"

#include <sys/socket.h>
#include <sys/un.h>
#include <unistd.h>

#include <cerrno>
#include <cstring>
#include <deque>
#include <mutex>
#include <stdexcept>
#include <thread>

#include "base/frame.h"
#include "base/unique_fd.h"
#include "common/json.h"

namespace fake {

using quivra::base::UniqueFd;

struct ScriptedServer::State {
    std::string path;
    UniqueFd listener;
    std::thread thread;
    std::vector<UniqueFd> kept_open;  // the thread's own
    mutable std::mutex mutex;
    std::deque<Turn> turns;
    Handler handler;
    std::vector<Json::Value> requests;
    int connections = 0;

    void Run();
    void Serve(UniqueFd connection);
};

bool ReadRequest(int fd, Json::Value& request) {
    std::string text;
    const bool is_whole = quivra::base::ReceiveFrame(fd, text);
    quivra::fromString(request, text);
    return is_whole;
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
    Json::Value request;
    if (turn.read_request && ReadRequest(connection.Get(), request)) {
        {
            const std::lock_guard lock(mutex);
            requests.push_back(request);
        }
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
    for (;;) {
        UniqueFd connection(accept4(listener.Get(), nullptr, nullptr, SOCK_CLOEXEC));
        if (connection.IsValid()) {
            Serve(std::move(connection));
        } else if (errno != EINTR) {
            return;  // shut down
        }
    }
}

ScriptedServer::ScriptedServer(const std::string& path) : state_(std::make_unique<State>()) {
    State& state = *state_;
    state.path = path;
    state.handler = [](const Json::Value&) { return Frame(R"({"success":true})"); };
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
    shutdown(state_->listener.Get(), SHUT_RDWR);
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

std::vector<Json::Value> ScriptedServer::Requests() const {
    const std::lock_guard lock(state_->mutex);
    return state_->requests;
}

int ScriptedServer::Connections() const {
    const std::lock_guard lock(state_->mutex);
    return state_->connections;
}

}  // namespace fake
