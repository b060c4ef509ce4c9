#pragma once

#include <json/json.h>

#include <functional>
#include <memory>
#include <string>
#include <vector>

#include "tests/support/files.h"

namespace fake {

using support::Frame;

/// What the server does with one connection: the default is to read the request, send `bytes` and
/// close.
struct Turn {
    std::string bytes;
    bool read_request = true;
    bool keep_open = false;  ///< until the server ends
};

/// A daemon that misbehaves as it is told: it listens on a Unix socket, in a thread of its own,
/// takes one connection after another and answers each by the next scripted turn, or by the
/// handler when none is left.
class ScriptedServer {
  public:
    /// The handler gets the parsed request and gives the bytes of the answer.
    using Handler = std::function<std::string(const Json::Value& request)>;

    /// Listens when it returns. The initial handler answers {"success": true}.
    explicit ScriptedServer(const std::string& path);
    /// Stops the thread, closes everything and removes the socket.
    ~ScriptedServer();
    ScriptedServer(const ScriptedServer&) = delete;
    ScriptedServer& operator=(const ScriptedServer&) = delete;

    void Then(Turn turn);
    /// The next connection gets `text`, framed.
    void ThenReply(const std::string& text) { Then({Frame(text)}); }
    void SetHandler(Handler handler);

    /// The requests read so far, oldest first.
    std::vector<Json::Value> Requests() const;
    int Connections() const;

  private:
    struct State;
    std::unique_ptr<State> state_;
};

}  // namespace fake
