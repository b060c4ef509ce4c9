#pragma once

#include <json/json.h>

#include <atomic>
#include <chrono>
#include <cstdint>
#include <functional>
#include <stop_token>
#include <string>
#include <thread>

#include "base/unique_fd.h"
#include "programs/kestoelasticd/catalog.h"

namespace elasticd {

struct ServiceOptions {
    std::string state_directory = "/var/lib/kesto/elastic";
    std::uint64_t min_free_space = std::uint64_t{64} << 20;  ///< bytes, where an index lies
    std::uint64_t min_memory = std::uint64_t{32} << 20;      ///< bytes that must be available
};

/// The protocol: one request text in, one reply text out. See docs/search-daemon.md. Safe from any
/// thread.
class Service {
  public:
    /// Makes the state directory when it is missing, and settles interrupted work. Only one process
    /// at a time may do this with a state directory: Error 506. Throws 502, 504, 505 when the state
    /// cannot be used.
    explicit Service(const ServiceOptions& options);

    /// Never throws, save for a lack of memory so severe that no reply can be made.
    std::string Handle(const std::string& request);

  private:
    std::string Compound(const Json::Value& elements);
    std::string RunCommand(const Json::Value& request, bool in_compound);
    std::string RunDocumentCommand(const std::string& command, const std::string& id,
                                   const Json::Value& data);
    void RunIndexCommand(const std::string& command, const std::string& id,
                         const Json::Value& data);
    void UseIndex(const std::string& id, const std::function<void(Index&)>& use);
    void CheckMemory();
    void MaintainIndexes(const std::stop_token& stop);

    const ServiceOptions options_;
    quivra::base::UniqueFd lock_;
    Catalog catalog_;
    std::atomic<std::chrono::steady_clock::rep> memory_checked_ = 0;
    std::atomic<bool> had_large_exchange_ = false;
    std::jthread maintenance_;
};

}  // namespace elasticd
