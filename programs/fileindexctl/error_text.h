#pragma once

#include <string>

#include "common/error.h"

namespace quivra::ctl {

/// The cause of a failure in our own words, "the search daemon is short of memory [1400]": never
/// the text that the library made for its log.
std::string DescribeCause(const Error& error);

/// What a daemon tells of an error in the library's log form ("Quivra error, code=800,
/// reason=[x]"), as DescribeCause words it; any other text as it is.
std::string Reworded(const std::string& text);

/// The sentence for a failure: "cannot add /photo: it is already indexed; use ... [901]". `doing`
/// names the attempt and its object. A code that only a daemon knows is told in its own words. One
/// line, whatever the names in it hold; not escaped.
std::string DescribeError(const std::string& doing, const Error& error);

/// Whether the library saved the change and could not tell the indexing daemon of it.
bool IsIndexerAway(const Error& error);

/// Whether the code has a cause and a remedy of its own in the table.
bool HasErrorText(int code);

}  // namespace quivra::ctl
