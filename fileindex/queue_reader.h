#pragma once

#include <cstddef>
#include <memory>
#include <string>

#include "base/unique_fd.h"
#include "common/log.h"

namespace quivra::fileindex {

/// Reads a queue file line by line.
class QueueReader {
  public:
    /// Opens the file. When that fails, IsOpen is false and errno tells why.
    explicit QueueReader(const std::string& path);

    bool IsOpen() const { return fd_.IsValid(); }

    /// Throws Error 502, logged for `site`, when the file could not be opened. Call it before
    /// errno changes.
    void RequireOpen(LogSite site) const;

    /// Reads the next line without its "\n", which the last line need not have. Of a line beyond
    /// kMaxLineSize only the beginning is returned, so much that it is beyond the limit still.
    /// False at the end of the file. Throws Error 502 when reading fails: that must not pass for
    /// an end.
    bool ReadLine(std::string& line);

  private:
    bool Fill();

    base::UniqueFd fd_;
    std::unique_ptr<char[]> buffer_;
    const char* next_ = nullptr;
    const char* end_ = nullptr;
};

}  // namespace quivra::fileindex
