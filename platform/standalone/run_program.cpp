#include "platform/standalone/run_program.h"
#include "base/file.h"

#include <fcntl.h>
#include <kesto/error.h>
#include <spawn.h>
#include <sys/mman.h>
#include <sys/syscall.h>
#include <sys/wait.h>
#include <unistd.h>

#include <array>
#include <cerrno>
#include <csignal>

#include "base/unique_fd.h"
#include "platform/standalone/error_state.h"

namespace kesto {
namespace {

using quivra::base::UniqueFd;

constexpr std::size_t kMaxOutput = 64U << 10;

/// How the program ended; in memory that the supervisor shares with its starter.
struct Result {
    int error;   ///< errno of the failed start, 0 after a start
    int status;  ///< as from waitpid
};

class SharedResult {
  public:
    SharedResult()
        : memory_(mmap(nullptr, sizeof(Result), PROT_READ | PROT_WRITE, MAP_SHARED | MAP_ANONYMOUS,
                       -1, 0)) {}
    ~SharedResult() {
        if (IsValid()) {
            munmap(memory_, sizeof(Result));
        }
    }
    SharedResult(const SharedResult&) = delete;
    SharedResult& operator=(const SharedResult&) = delete;

    bool IsValid() const { return memory_ != MAP_FAILED; }
    Result* operator->() const { return static_cast<Result*>(memory_); }

  private:
    void* memory_;
};

/// Waits for a child of whatever kind. False with errno set when there is none.
bool WaitFor(pid_t pid, int& status) {
    while (waitpid(pid, &status, __WALL) < 0) {
        if (errno != EINTR) {
            return false;
        }
    }
    return true;
}

/// The supervisor's life: starts the program, waits for it and notes how it ended. `output` becomes
/// the standard output; -1 keeps the caller's. It calls nothing that
/// another thread of the caller could have left locked.
[[noreturn]] void Supervise(const char* program, char* const* argv, int output,
                            const SharedResult& result) {
    struct sigaction action {};
    action.sa_handler = SIG_DFL;
    for (int signal = 1; signal < NSIG; ++signal) {
        sigaction(signal, &action, nullptr);
    }
    if (output >= 0 && dup2(output, STDOUT_FILENO) < 0) {
        result->error = errno;
        _exit(1);
    }
    close_range(STDERR_FILENO + 1, ~0U, 0);
    sigset_t none;
    sigemptyset(&none);
    sigprocmask(SIG_SETMASK, &none, nullptr);
    pid_t pid = -1;
    result->error = posix_spawn(&pid, program, nullptr, nullptr, argv, environ);
    if (result->error != 0) {
        _exit(1);
    }
    int status = 0;
    WaitFor(pid, status);
    result->status = status;
    _exit(0);
}

/// Forks the supervisor without an exit signal. So it is no child that the caller's SIGCHLD
/// handler, or an ignored SIGCHLD, could reap before us; the program itself, which is such a child
/// from its exec on, is the supervisor's. Signals are blocked meanwhile, because the caller's
/// handlers must not run in the copy.
pid_t StartSupervisor(const char* program, char* const* argv, int output,
                      const SharedResult& result) {
    sigset_t all;
    sigset_t old;
    sigfillset(&all);
    pthread_sigmask(SIG_SETMASK, &all, &old);
    const long pid = syscall(SYS_clone, 0L, 0L, 0L, 0L, 0L);
    if (pid == 0) {
        Supervise(program, argv, output, result);
    }
    const int saved_errno = errno;
    pthread_sigmask(SIG_SETMASK, &old, nullptr);
    errno = saved_errno;
    return static_cast<pid_t>(pid);
}

/// Takes in all of the output, so that the program never waits for a reader, and keeps its start.
void Collect(int fd, std::string& output) {
    quivra::base::ReadUpTo(fd, kMaxOutput, output);
    std::string rest;
    do {
        rest.clear();
    } while (quivra::base::ReadUpTo(fd, kMaxOutput, rest) && !rest.empty());
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
    const SharedResult result;
    const pid_t pid = result.IsValid()
                          ? StartSupervisor(program.c_str(), argv.data(), write_end.Get(), result)
                          : -1;
    write_end.Reset();
    if (pid < 0) {
        return SetError(KESTO_ERR_SYSTEM);
    }
    if (output != nullptr) {
        Collect(read_end.Get(), *output);
    }
    int supervisor_status = 0;
    if (!WaitFor(pid, supervisor_status)) {
        return SetError(KESTO_ERR_SYSTEM);
    }
    errno = result->error != 0 ? result->error : saved_errno;
    if (result->error != 0) {
        return SetError(result->error == ENOENT ? KESTO_ERR_NOT_INSTALLED : KESTO_ERR_SYSTEM);
    }
    if (!WIFEXITED(supervisor_status) || !WIFEXITED(result->status)) {
        return SetError(KESTO_ERR_COMMAND_FAILED);
    }
    return WEXITSTATUS(result->status);
}

}  // namespace kesto
