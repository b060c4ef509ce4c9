#pragma once

#include <string>

#include "common/error.h"

namespace quivra::ctl {

/// The sentence for a failure: "cannot add /photo: it is already indexed; use ... [901]". `doing`
/// names the attempt and its object. A code that only a daemon knows is told in its own words.
std::string DescribeError(const std::string& doing, const Error& error);

/// Whether the code has a cause and a remedy of its own in the table.
bool HasErrorText(int code);

}  // namespace quivra::ctl
