#include "programs/kestokosnotify/message.h"

#include <algorithm>
#include <iterator>

namespace notify {
namespace {

struct MessageText {
    const char* key;
    const char* text;
};

constexpr MessageText kTexts[] = {
    {"app:displayname", "Quivra"},
    {"error:index_no_space",
     "Files are no longer indexed because the volume is full. Delete files to make room, or choose "
     "other folders in the {0}index preferences{1}."},
    {"error:lack_of_memory",
     "Indexing waits because memory is short. It goes on by itself when other programs have "
     "released some."},
};

}  // namespace

std::string ResolveMessage(const std::string& key, const std::vector<std::string>& arguments) {
    const auto it = std::find_if(std::begin(kTexts), std::end(kTexts),
                                 [&](const MessageText& entry) { return entry.key == key; });
    if (it == std::end(kTexts)) {
        return key;
    }
    const std::string text = it->text;
    std::string resolved;
    for (std::size_t i = 0; i < text.size(); ++i) {
        if (text[i] != '{') {
            resolved += text[i];
            continue;
        }
        const auto place = static_cast<std::size_t>(text[i + 1] - '0');
        resolved += place < arguments.size() ? arguments[place] : "";
        i += 2;  // the digit and the bracket
    }
    return resolved;
}

std::string OneLine(const std::string& text) {
    std::string line;
    for (std::size_t i = 0; i < text.size();) {
        const auto first = static_cast<unsigned char>(text[i]);
        const std::size_t length = first < 0x80                     ? 1
                                   : first >= 0xc2 && first <= 0xdf ? 2
                                   : first >= 0xe0 && first <= 0xef ? 3
                                   : first >= 0xf0 && first <= 0xf4 ? 4
                                                                    : 0;
        std::size_t end = i + 1;
        while (end < i + length && end < text.size() && (text[end] & 0xc0) == 0x80) {
            ++end;
        }
        const std::string character = text.substr(i, end - i);
        // U+0080 to U+009F: some terminals begin a command with one of them, too.
        const bool is_control =
            first < 0x20 || first == 0x7f ||
            (first == 0xc2 && end == i + 2 && static_cast<unsigned char>(text[i + 1]) < 0xa0);
        line += is_control ? " " : character.size() == length ? character : "?";
        i = end;
    }
    return line;
}

std::string WithoutTags(const std::string& text) {
    std::string plain;
    bool is_in_tag = false;
    for (const char c : text) {
        is_in_tag = is_in_tag || c == '<';
        if (!is_in_tag) {
            plain += c;
        }
        is_in_tag = is_in_tag && c != '>';
    }
    return plain;
}

}  // namespace notify
