#include "platform/standalone/run_program.h"

#include <fcntl.h>
#include <kesto/error.h>
#include <sched.h>
#include <sys/wait.h>
#include <unistd.h>

#include <algorithm>
#include <array>
#include <cerrno>
#include <csignal>

#include "common/unique_fd.h"
#include "platform/standalone/error_state.h"
#include "platform/standalone/file_io.h"

namespace kesto {
namespace {

using quivra::UniqueFd;

constexpr std::size_t kMaxOutput = 64U << 10;
constexpr std::size_t kStackSize = 64U << 10;

struct Launch {
    const char* program;
    char* const* argv;
    int output;        ///< becomes the standard output; -1 keeps the caller's
    sigset_t signals;  ///< the caller's mask
    int error = 0;     ///< errno of the failed start
};

/// Runs in the new process, on its own stack but in the caller's memory, while the caller's thread
/// stands still: only system calls here. All signals are blocked until the caller's handlers are
/// off.
int Child(void* argument) {
    auto* launch = static_cast<Launch*>(argument);
    struct sigaction action {};
    action.sa_handler = SIG_DFL;
    for (int signal = 1; signal < NSIG; ++signal) {
        sigaction(signal, &action, nullptr);
    }
    if (launch->output >= 0 && dup2(launch->output, STDOUT_FILENO) < 0) {
        launch->error = errno;
        _exit(127);
    }
    close_range(STDERR_FILENO + 1, ~0U, 0);
    sigset_t none;
    sigemptyset(&none);
    sigprocmask(SIG_SETMASK, &none, nullptr);
    execv(launch->program, launch->argv);
    launch->error = errno;
    _exit(127);
}

/// Starts the process without an exit signal. So it is no child that the caller's SIGCHLD handler,
/// or an ignored SIGCHLD, could reap before us.
pid_t Start(Launch& launch) {
    std::vector<char> stack(kStackSize);
    sigset_t all;
    sigfillset(&all);
    pthread_sigmask(SIG_SETMASK, &all, &launch.signals);
    const pid_t pid = clone(Child, stack.data() + stack.size(), CLONE_VM | CLONE_VFORK, &launch);
    const int error = pid < 0 ? errno : launch.error;
    pthread_sigmask(SIG_SETMASK, &launch.signals, nullptr);
    launch.error = error;
    return pid;
}

int WaitFor(pid_t pid) {
    int status = 0;
    while (waitpid(pid, &status, __WALL) < 0) {
        if (errno != EINTR) {
            return -1;
        }
    }
    return status;
}

/// Takes in all of the output, so that the program never waits for a reader, and keeps its start.
void Collect(int fd, std::string& output) {
    ReadUpTo(fd, kMaxOutput, output);
    std::string rest;
    do {
        rest.clear();
    } while (ReadUpTo(fd, kMaxOutput, rest) && !rest.empty());
}

}  // namespace

int RunProgram(const std::string& program, const std::vector<std::string>& arguments,
               std::string* output) {
    const int saved_errno = errno;
    std::vector<char*> argv{
        const_cast<char*>(program.c_str())};  // execv's interface; it only reads
    for (const std::string& argument : arguments) {
        argv.push_back(const_cast<char*>(argument.c_str()));
    }
    argv.push_back(nullptr);
    std::array<int, 2> ends{-1, -1};
    if (output != nullptr && pipe2(ends.data(), O_CLOEXEC) != 0) {
        return SetError(KESTO_ERR_SYSTEM);
    }
    const UniqueFd read_end(ends[0]);
    UniqueFd write_end(ends[1]);
    Launch launch{program.c_str(), argv.data(), write_end.Get(), {}};
    const pid_t pid = Start(launch);
    write_end.Reset();
    if (pid >= 0 && output != nullptr) {
        Collect(read_end.Get(), *output);
    }
    const int status = pid < 0 ? -1 : WaitFor(pid);
    errno = launch.error != 0 ? launch.error : saved_errno;
    if (launch.error != 0) {
        return SetError(launch.error == ENOENT ? KESTO_ERR_NOT_INSTALLED : KESTO_ERR_SYSTEM);
    }
    if (status < 0 || !WIFEXITED(status)) {
        return SetError(KESTO_ERR_COMMAND_FAILED);
    }
    return WEXITSTATUS(status);
}

}  // namespace kesto
