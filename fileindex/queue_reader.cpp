#include "fileindex/queue_reader.h"

#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <cstring>

#include "fileindex/queue_directory.h"
#include "fileindex/queue_line.h"

namespace quivra::fileindex {
namespace {

constexpr std::size_t kBufferSize = 64 * 1024;

}  // namespace

QueueReader::QueueReader(const std::string& path) : fd_(QueueDirectory::OpenFile(path)) {}

void QueueReader::RequireOpen(LogSite site) const {
    if (!IsOpen()) {
        const std::string reason = "Failed to open queue, reason=" + SystemErrorText(errno);
        Fail(site, "!input_stream", Error(Error::kSystemCallFailed, reason));
    }
}

bool QueueReader::ReadLine(std::string& line) {
    line.clear();
    bool found_text = false;
    while (next_ != end_ || Fill()) {
        found_text = true;
        const std::size_t available = static_cast<std::size_t>(end_ - next_);
        const auto* newline = static_cast<const char*>(std::memchr(next_, '\n', available));
        const char* const stop = newline != nullptr ? newline : end_;
        const std::size_t room = kMaxLineSize + 1 - line.size();
        line.append(next_, std::min(room, static_cast<std::size_t>(stop - next_)));
        if (newline != nullptr) {
            next_ = newline + 1;
            return true;
        }
        next_ = end_;
    }
    return found_text;
}

bool QueueReader::Fill() {
    if (buffer_ == nullptr) {
        buffer_ = std::make_unique_for_overwrite<char[]>(kBufferSize);
    }
    ssize_t size = 0;
    do {
        size = read(fd_.Get(), buffer_.get(), kBufferSize);
    } while (size < 0 && errno == EINTR);
    if (size < 0) {
        const std::string reason = "Failed to read queue, reason=" + SystemErrorText(errno);
        Fail({"queue_reader", __LINE__}, "0 > read(fd, buffer, size)",
             Error(Error::kSystemCallFailed, reason));
    }
    next_ = buffer_.get();
    end_ = next_ + size;
    return size > 0;
}

}  // namespace quivra::fileindex
