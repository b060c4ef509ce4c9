#pragma once

#include <string>
#include <vector>

namespace notify {

/// The English text of a message key ("app:displayname"), with "{0}", "{1}" and so on replaced by
/// the arguments; a place without an argument is left out. A key that is not known is its own text,
/// so that no notice is lost.
std::string ResolveMessage(const std::string& key, const std::vector<std::string>& arguments = {});

/// The text as a plain line: without <tags> and control characters, which a terminal would obey.
std::string PlainText(const std::string& text);

}  // namespace notify
