#include "programs/fileindexctl/output.h"

#include <fcntl.h>
#include <unistd.h>

#include <cerrno>

#include "base/file.h"

namespace quivra::ctl {

DescriptorBuffer::DescriptorBuffer(int fd) : fd_(fd) {
    setp(buffer_.data(), buffer_.data() + buffer_.size());
}

DescriptorBuffer::~DescriptorBuffer() {
    DescriptorBuffer::sync();
}

DescriptorBuffer::int_type DescriptorBuffer::overflow(int_type character) {
    if (sync() != 0) {
        return traits_type::eof();
    }
    if (!traits_type::eq_int_type(character, traits_type::eof())) {
        *pptr() = traits_type::to_char_type(character);
        pbump(1);
    }
    return traits_type::not_eof(character);
}

int DescriptorBuffer::sync() {
    if (error_ == 0 &&
        !base::WriteAll(fd_, {pbase(), static_cast<std::size_t>(pptr() - pbase())})) {
        error_ = errno;
    }
    // Also after a failure: a buffer that stays full would be written again and again.
    setp(buffer_.data(), buffer_.data() + buffer_.size());
    return error_ == 0 ? 0 : -1;
}

Silence::Silence() {
    const base::UniqueFd nowhere(open("/dev/null", O_WRONLY | O_CLOEXEC));
    base::UniqueFd output(fcntl(STDOUT_FILENO, F_DUPFD_CLOEXEC, STDERR_FILENO + 1));
    base::UniqueFd error(fcntl(STDERR_FILENO, F_DUPFD_CLOEXEC, STDERR_FILENO + 1));
    if (nowhere.IsValid() && output.IsValid() && error.IsValid()) {
        dup2(nowhere.Get(), STDOUT_FILENO);
        dup2(nowhere.Get(), STDERR_FILENO);
        output_ = std::move(output);
        error_ = std::move(error);
    }
}

Silence::~Silence() {
    if (output_.IsValid()) {
        dup2(output_.Get(), STDOUT_FILENO);
        dup2(error_.Get(), STDERR_FILENO);
    }
}

}  // namespace quivra::ctl
