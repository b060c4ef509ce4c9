#include "tests/support/program.h"

#include <fcntl.h>
#include <signal.h>
#include <sys/socket.h>
#include <sys/un.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cstring>
#include <filesystem>
#include <stdexcept>
#include <thread>
#include <utility>

#include "base/unique_fd.h"

namespace support {
namespace {

pid_t Spawn(const std::string& name, const std::vector<std::string>& arguments, int output) {
    const std::string path = std::string(FILEINDEX_BIN_DIR) + "/" + name;
    std::vector<const char*> argv{path.c_str()};
    for (const std::string& argument : arguments) {
        argv.push_back(argument.c_str());
    }
    argv.push_back(nullptr);
    const pid_t pid = fork();
    if (pid == 0) {
        dup2(output, STDOUT_FILENO);
        dup2(output, STDERR_FILENO);
        execv(path.c_str(), const_cast<char* const*>(argv.data()));
        _exit(127);
    }
    if (pid < 0) {
        throw std::runtime_error("cannot start " + name);
    }
    return pid;
}

int ExitCode(int status) {
    return WIFEXITED(status) ? WEXITSTATUS(status) : -WTERMSIG(status);
}

bool Answers(const std::string& socket_path) {
    sockaddr_un address{};
    address.sun_family = AF_UNIX;
    std::strncpy(address.sun_path, socket_path.c_str(), sizeof(address.sun_path) - 1);
    const quivra::base::UniqueFd fd(socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0));
    return connect(fd.Get(), reinterpret_cast<const sockaddr*>(&address), sizeof(address)) == 0;
}

}  // namespace

Program::Program(const std::string& name, const std::vector<std::string>& arguments) {
    std::filesystem::create_directories("/var/log");
    const std::string log = "/var/log/" + name + ".log";
    const quivra::base::UniqueFd output(
        open(log.c_str(), O_WRONLY | O_CREAT | O_APPEND | O_CLOEXEC, 0644));
    pid_ = Spawn(name, arguments, output.Get());
}

Program::~Program() {
    Stop(SIGKILL);
}

Program::Program(Program&& other) noexcept
    : pid_(std::exchange(other.pid_, -1)), status_(other.status_) {}

Program& Program::operator=(Program&& other) noexcept {
    if (this != &other) {
        Stop(SIGKILL);
        pid_ = std::exchange(other.pid_, -1);
        status_ = other.status_;
    }
    return *this;
}

int Program::Wait() {
    if (pid_ > 0 && waitpid(pid_, &status_, 0) == pid_) {
        pid_ = -1;
    }
    return ExitCode(status_);
}

int Program::Stop(int signal) {
    if (pid_ > 0) {
        kill(pid_, signal);
    }
    return Wait();
}

bool Program::IsRunning() {
    if (pid_ > 0 && waitpid(pid_, &status_, WNOHANG) == pid_) {
        pid_ = -1;
    }
    return pid_ > 0;
}

Outcome RunProgram(const std::string& name, const std::vector<std::string>& arguments) {
    int ends[2];
    if (pipe2(ends, O_CLOEXEC) != 0) {
        throw std::runtime_error("no pipe");
    }
    const quivra::base::UniqueFd reader(ends[0]);
    quivra::base::UniqueFd writer(ends[1]);
    const pid_t pid = Spawn(name, arguments, writer.Get());
    writer.Reset();
    Outcome outcome{};
    char buffer[4096];
    for (ssize_t size = 0; (size = read(reader.Get(), buffer, sizeof(buffer))) > 0;) {
        outcome.output.append(buffer, static_cast<std::size_t>(size));
    }
    int status = 0;
    waitpid(pid, &status, 0);
    outcome.status = ExitCode(status);
    return outcome;
}

bool Eventually(const std::function<bool()>& condition, std::chrono::milliseconds limit) {
    const auto deadline = std::chrono::steady_clock::now() + limit;
    while (!condition()) {
        if (std::chrono::steady_clock::now() > deadline) {
            return false;
        }
        std::this_thread::sleep_for(std::chrono::milliseconds(5));
    }
    return true;
}

Program StartDaemon(const std::string& name, const std::string& socket_path,
                    const std::vector<std::string>& arguments) {
    Program daemon(name, arguments);
    const bool answers = Eventually([&] { return Answers(socket_path) || !daemon.IsRunning(); });
    if (!answers || !daemon.IsRunning()) {
        throw std::runtime_error(name + " does not answer on " + socket_path);
    }
    return daemon;
}

}  // namespace support
