#pragma once

#include <string>

#include "common/error.h"

namespace quivra::ctl {

/// The cause of a failure in our own words, "the search daemon is short of memory [1400]": never
/// the text that the library made for its log.
std::string DescribeCause(const Error& error);

/// The sentence for a failure: "cannot add /photo: it is already indexed; use ... [901]". `doing`
/// names the attempt and its object. A code that only a daemon knows is told in its own words. One
/// line, whatever the names in it hold; not escaped.
std::string DescribeError(const std::string& doing, const Error& error);

/// Whether the library saved the change and could not tell the indexing daemon of it.
bool IsIndexerAway(const Error& error);

/// Whether the code has a cause and a remedy of its own in the table.
bool HasErrorText(int code);

}  // namespace quivra::ctl
