#include "base/queue_file.h"

#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>

namespace quivra::base {
namespace {

/// Writes at the offset what fits. Returns how much.
std::size_t WriteAt(int fd, off_t offset, std::string_view text) {
    std::size_t done = 0;
    while (done < text.size()) {
        const ssize_t written =
            pwrite(fd, text.data() + done, text.size() - done, offset + static_cast<off_t>(done));
        if (written == 0 || (written < 0 && errno != EINTR)) {
            break;
        }
        done += static_cast<std::size_t>(std::max<ssize_t>(written, 0));
    }
    return done;
}

}  // namespace

std::string WorkingCopy(std::string_view queue) {
    return std::string(queue) + ".tmp";
}

std::size_t AppendLines(int fd, std::string_view lines) {
    struct stat status {};
    if (fstat(fd, &status) != 0) {
        return 0;
    }
    off_t end = status.st_size;
    char last = '\n';
    if (end > 0 && pread(fd, &last, 1, end - 1) != 1) {
        return 0;
    }
    // A writer died, or the disk was full, in the middle of the last line.
    if (last != '\n') {
        if (WriteAt(fd, end, "\n") != 1) {
            return 0;
        }
        ++end;
    }
    const std::size_t written = WriteAt(fd, end, lines);
    if (written == lines.size()) {
        return written;
    }
    const int saved_errno = errno;
    const std::size_t newline = lines.substr(0, written).rfind('\n');
    const std::size_t whole = newline == lines.npos ? 0 : newline + 1;
    // If the cut fails too, the next append ends the torn line, and the reader logs and skips it.
    [[maybe_unused]] const int cut = ftruncate(fd, end + static_cast<off_t>(whole));
    errno = saved_errno;
    return whole;
}

}  // namespace quivra::base
