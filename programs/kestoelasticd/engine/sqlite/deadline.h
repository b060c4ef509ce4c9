#pragma once

#include <chrono>

#include "programs/sqlite/database.h"

namespace elasticd::engine::sqlite {

/// Ends statements of a connection when the time has come: they throw an interruption. SQLite asks
/// every few thousand steps of its machine; long work that makes none asks HasPassed itself.
class Deadline {
  public:
    using Clock = std::chrono::steady_clock;

    Deadline(::sqlite::Database& database, Clock::time_point end);
    ~Deadline();
    Deadline(const Deadline&) = delete;
    Deadline& operator=(const Deadline&) = delete;

    bool HasPassed() const { return Clock::now() >= end_; }
    /// Throws the interruption.
    void Check() const;

  private:
    ::sqlite::Database& database_;
    const Clock::time_point end_;
};

}  // namespace elasticd::engine::sqlite
