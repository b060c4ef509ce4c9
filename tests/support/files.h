#pragma once

#include <string>
#include <string_view>

/// Files, as tests need them: in one call.
namespace support {

/// Makes the file and the directories above it, or gives an existing file that content. False when
/// that fails, for the few tests of a full disk.
bool WriteFile(const std::string& path, std::string_view content = "content");

/// The content of the file; empty when it cannot be read.
std::string ReadFile(const std::string& path);

/// The mode bits of the object itself; 0 when there is none.
unsigned int ModeOf(const std::string& path);

/// A message as it goes over a daemon's socket.
std::string Frame(std::string_view message);

/// An empty directory of its own, removed with all that is in it at the end of the scope.
class TemporaryDirectory {
  public:
    TemporaryDirectory();
    ~TemporaryDirectory();
    TemporaryDirectory(const TemporaryDirectory&) = delete;
    TemporaryDirectory& operator=(const TemporaryDirectory&) = delete;

    const std::string& Path() const { return path_; }
    /// The path of that name in it.
    std::string operator/(std::string_view name) const;

  private:
    std::string path_ = "/tmp/test.XXXXXX";
};

}  // namespace support
