#include "programs/kestoelasticd/engine/sqlite/deadline.h"

#include <sqlite3.h>

namespace elasticd::engine::sqlite {
namespace {

/// Some hundred microseconds.
constexpr int kStepsBetween = 4000;

}  // namespace

Deadline::Deadline(::sqlite::Database& database, Clock::time_point end)
    : database_(database), end_(end) {
    sqlite3_progress_handler(
        database.Handle(), kStepsBetween,
        [](void* self) { return static_cast<const Deadline*>(self)->HasPassed() ? 1 : 0; }, this);
}

Deadline::~Deadline() {
    sqlite3_progress_handler(database_.Handle(), 0, nullptr, nullptr);
}

void Deadline::Check() const {
    if (HasPassed()) {
        throw ::sqlite::Error(SQLITE_INTERRUPT, "the deadline has passed");
    }
}

}  // namespace elasticd::engine::sqlite
