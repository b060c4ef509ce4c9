#pragma once

#include <string>
#include <vector>

namespace notify {

/// The English text of a message key ("app:displayname"), with "{0}", "{1}" and so on replaced by
/// the arguments; a place without an argument is left out. A key that is not known is its own text,
/// so that no notice is lost.
std::string ResolveMessage(const std::string& key, const std::vector<std::string>& arguments = {});

/// The text as one line that a terminal or log shows and does not obey: a blank for each control
/// character (those beyond ASCII included), a "?" for each byte that is not UTF-8.
std::string OneLine(const std::string& text);

/// The text without its <tags>.
std::string WithoutTags(const std::string& text);

}  // namespace notify
