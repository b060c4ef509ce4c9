#include "tests/support/users.h"

#include <fcntl.h>
#include <grp.h>
#include <signal.h>
#include <sys/prctl.h>
#include <sys/wait.h>
#include <unistd.h>

#include <array>
#include <stdexcept>

#include "base/file.h"
#include "tests/support/files.h"

namespace support {
namespace {

constexpr std::size_t kMaxResult = 1 << 20;

void BecomeUser(uid_t uid) {
    if (setgroups(0, nullptr) != 0 || setresgid(uid, uid, uid) != 0 ||
        setresuid(uid, uid, uid) != 0) {
        _exit(126);
    }
}

}  // namespace

bool HasOtherUsers() {
    return ReadFile("/proc/self/uid_map").find("4294967295") != std::string::npos;
}

std::string InChild(const std::function<std::string()>& body) {
    std::array<int, 2> ends{};
    if (pipe2(ends.data(), O_CLOEXEC) != 0) {
        throw std::runtime_error("no pipe");
    }
    const quivra::base::UniqueFd reader(ends[0]);
    quivra::base::UniqueFd writer(ends[1]);
    const pid_t pid = fork();
    if (pid == 0) {
        const bool written = quivra::base::WriteAll(writer.Get(), body());
        _exit(written ? 0 : 1);
    }
    writer.Reset();
    std::string result;
    quivra::base::ReadUpTo(reader.Get(), kMaxResult, result);
    int status = 0;
    waitpid(pid, &status, 0);
    return WIFEXITED(status) && WEXITSTATUS(status) == 0 ? result : "crashed";
}

std::string AsUser(uid_t uid, const std::function<std::string()>& body) {
    return InChild([&] {
        BecomeUser(uid);
        return body();
    });
}

UserLoop::UserLoop(uid_t uid, const std::function<void()>& body) : pid_(fork()) {
    if (pid_ == 0) {
        BecomeUser(uid);
        prctl(PR_SET_PDEATHSIG, SIGKILL);  // behind the change of user, which clears it
        while (true) {
            body();
        }
    }
}

UserLoop::~UserLoop() {
    if (pid_ > 0) {
        kill(pid_, SIGKILL);
        waitpid(pid_, nullptr, 0);
    }
}

}  // namespace support
