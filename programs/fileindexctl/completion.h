#pragma once

#include <string>
#include <vector>

#include "programs/fileindexctl/command_line.h"

namespace quivra::ctl {

/// The first argument of a call by a shell that completes a command line. It is not for people.
inline constexpr const char* kCompleteOption = "--complete";

/// Prints what may stand in the place of the last of `words` (the command line so far, without the
/// program's name; the last may be empty): one candidate a line, followed by a tab and what it
/// means, and the line ":files" where file names may stand there, too. So the shells' scripts hold
/// no list of their own. Throws nothing: a shell has no place for messages.
void Complete(CommandLine& line, std::vector<std::string> words, Session& session);

}  // namespace quivra::ctl
