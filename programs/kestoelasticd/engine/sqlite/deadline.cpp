#include "programs/kestoelasticd/engine/sqlite/deadline.h"

#include <sqlite3.h>
#include <sys/resource.h>
#include <unistd.h>

namespace elasticd::engine::sqlite {
namespace {

/// Some hundred microseconds.
constexpr int kStepsBetween = 4000;
constexpr std::chrono::milliseconds kLong{100};
constexpr int kStepBack = 10;
constexpr std::chrono::microseconds kPerHit{200};

void SetPriority(int priority) {
    setpriority(PRIO_PROCESS, static_cast<id_t>(gettid()), priority);
}

}  // namespace

Deadline::Deadline(::sqlite::Database& database, Clock::time_point end)
    : database_(database),
      end_(end),
      priority_(getpriority(PRIO_PROCESS, static_cast<id_t>(gettid()))) {
    sqlite3_progress_handler(
        database.Handle(), kStepsBetween,
        [](void* self) { return static_cast<const Deadline*>(self)->HasPassed() ? 1 : 0; }, this);
}

Deadline::~Deadline() {
    if (stepped_back_) {
        SetPriority(priority_);
    }
    sqlite3_progress_handler(database_.Handle(), 0, nullptr, nullptr);
}

bool Deadline::HasPassed() const {
    const auto now = Clock::now();
    // Only root may come back to the priority that it had.
    if (!stepped_back_ && now - begin_ > kLong && geteuid() == 0) {
        stepped_back_ = true;
        SetPriority(priority_ + kStepBack);
    }
    return now >= end_;
}

void Deadline::AllowForHit() {
    if (end_ != Clock::time_point::max()) {
        end_ += kPerHit;
    }
}

void Deadline::Check() const {
    if (HasPassed()) {
        throw ::sqlite::Error(SQLITE_INTERRUPT, "the deadline has passed");
    }
}

}  // namespace elasticd::engine::sqlite
