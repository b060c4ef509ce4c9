#include "programs/kestokosnotify/terminals.h"

#include <fcntl.h>
#include <unistd.h>
#include <utmpx.h>

#include <algorithm>
#include <cstring>
#include <set>

#include "base/unique_fd.h"

namespace notify {
namespace {

/// A field of a login record, which need not end in NUL.
template <std::size_t kSize>
std::string Field(const char (&field)[kSize]) {
    return {field, std::find(std::begin(field), std::end(field), '\0')};
}

bool WriteToTerminal(const std::string& line, const std::string& text) {
    // Login records are written by programs of every kind: only a terminal below /dev is taken.
    if (line.empty() || line[0] == '/' || line.find("..") != std::string::npos) {
        return false;
    }
    const quivra::base::UniqueFd fd(
        open(("/dev/" + line).c_str(), O_WRONLY | O_NONBLOCK | O_NOCTTY | O_NOFOLLOW | O_CLOEXEC));
    return fd.IsValid() && isatty(fd.Get()) == 1 &&
           write(fd.Get(), text.data(), text.size()) == static_cast<ssize_t>(text.size());
}

}  // namespace

int WriteToTerminals(const std::string& text,
                     const std::function<bool(const std::string& user)>& is_recipient) {
    // Collected first: writing may take a moment, and the records are a shared state of libc.
    std::set<std::string> lines;  // a terminal may have several records
    setutxent();
    while (const utmpx* entry = getutxent()) {
        if (entry->ut_type == USER_PROCESS && is_recipient(Field(entry->ut_user))) {
            lines.insert(Field(entry->ut_line));
        }
    }
    endutxent();
    return static_cast<int>(std::count_if(
        lines.begin(), lines.end(), [&](const auto& line) { return WriteToTerminal(line, text); }));
}

}  // namespace notify
