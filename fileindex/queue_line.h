#pragma once

#include <cstddef>
#include <string>

#include "fileindex/event.h"

namespace quivra::fileindex {

/// A longer line, and a line with a longer path, is a bad line. No file system gives such a path;
/// what a line may cost in time and memory has to end somewhere.
inline constexpr std::size_t kMaxLineSize = std::size_t{1} << 20;
inline constexpr std::size_t kMaxPathSize = std::size_t{64} << 10;

/// Parses a line in the way of monitors: an object of known members of their usual types, within
/// the limits. False for everything else, and `event` is unspecified then.
bool ParsePlainLine(Event& event, const std::string& text);

/// Parses any line, or throws what Event's constructor throws. `event.event` is set as soon as it
/// could be read, also when what follows it is bad; else it is 0.
void ParseLine(Event& event, const std::string& text);

/// A line as it is put into the log and into errors: cut where it is beyond the limit.
std::string ShownLine(const std::string& text);

/// A line and its event, to be used again for the next line, which saves most allocations.
struct QueueLine {
    std::string text;
    Event event = Event();
    bool is_plain = false;  ///< `event` is that of `text`; else it is still to be parsed
};

}  // namespace quivra::fileindex
