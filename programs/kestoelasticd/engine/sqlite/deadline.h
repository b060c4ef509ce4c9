#pragma once

#include <chrono>

#include "programs/sqlite/database.h"

namespace elasticd::engine::sqlite {

/// Ends statements of a connection when the time has come: they throw an interruption. SQLite asks
/// every few thousand steps of its machine; long work that makes none asks HasPassed itself.
/// A search that takes long steps back behind the others: its thread runs at a lower priority from
/// then on, until this goes. Used by one thread.
class Deadline {
  public:
    using Clock = std::chrono::steady_clock;

    Deadline(::sqlite::Database& database, Clock::time_point end);
    ~Deadline();
    Deadline(const Deadline&) = delete;
    Deadline& operator=(const Deadline&) = delete;

    bool HasPassed() const;
    /// Throws the interruption.
    void Check() const;
    /// A hit was handed over: lists of any length are legal, so each buys a little time.
    void AllowForHit();

  private:
    ::sqlite::Database& database_;
    const Clock::time_point begin_ = Clock::now();
    Clock::time_point end_;
    mutable bool stepped_back_ = false;
    int priority_ = 0;  ///< before that
};

}  // namespace elasticd::engine::sqlite
