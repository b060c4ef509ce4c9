#pragma once

#include <json/json.h>

#include <future>
#include <mutex>
#include <string>
#include <thread>
#include <vector>

#include "base/unique_fd.h"
#include "programs/daemon/frame_server.h"

namespace kestotifyd {

/// Serves {"type":"state"} on the monitor's socket (base/frame.h; for root only). The waiting for
/// clients is done by threads of its own, but the reply is made by the monitor's loop: a monitor
/// whose loop does not turn does not reply, and its asker sees that.
class StateServer {
  public:
    /// Throws Error 506 or 502 when the socket cannot be made.
    explicit StateServer(const std::string& path);
    ~StateServer();
    StateServer(const StateServer&) = delete;
    StateServer& operator=(const StateServer&) = delete;

    /// Readable while somebody waits for Reply.
    int Fd() const { return asked_.Get(); }

    /// Gives `data` to all who have asked so far.
    void Reply(const Json::Value& data);

  private:
    std::string Handle(const std::string& request);

    quivra::base::UniqueFd asked_;
    std::mutex mutex_;
    std::vector<std::promise<std::string>> waiting_;  ///< guarded by mutex_
    quivra::daemon::FrameServer server_;
    std::thread thread_;
};

}  // namespace kestotifyd
