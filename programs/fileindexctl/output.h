#pragma once

#include <array>
#include <streambuf>

#include "base/unique_fd.h"

namespace quivra::ctl {

/// A buffered stream to a descriptor that remembers why writing failed, which the standard streams
/// do not: a closed pipe is not a failure worth a message, a full disk is. Borrows the descriptor.
class DescriptorBuffer : public std::streambuf {
  public:
    explicit DescriptorBuffer(int fd);
    ~DescriptorBuffer() override;
    DescriptorBuffer(const DescriptorBuffer&) = delete;
    DescriptorBuffer& operator=(const DescriptorBuffer&) = delete;

    /// errno of the first failed write, 0 for none. After it everything written is dropped.
    int Error() const { return error_; }

  protected:
    int_type overflow(int_type character) override;
    int sync() override;

  private:
    int fd_;
    int error_ = 0;
    std::array<char, 16384> buffer_{};
};

/// While it lives, the process's standard output and error lead nowhere. The services and programs
/// that the library runs inherit these two, and their chatter has no place among our own.
class Silence {
  public:
    Silence();
    ~Silence();
    Silence(const Silence&) = delete;
    Silence& operator=(const Silence&) = delete;

  private:
    base::UniqueFd output_;  ///< what the two were; invalid: nothing was changed
    base::UniqueFd error_;
};

}  // namespace quivra::ctl
