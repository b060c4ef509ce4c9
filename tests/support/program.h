#pragma once

#include <sys/types.h>

#include <chrono>
#include <functional>
#include <string>
#include <vector>

namespace support {

/// A program of this project, started from the build tree as a child process. The destructor kills
/// it. Use from one thread.
class Program {
  public:
    /// Starts build/bin/NAME. Its standard output and error go to /var/log/NAME.log.
    Program(const std::string& name, const std::vector<std::string>& arguments);
    ~Program();
    Program(Program&& other) noexcept;
    Program& operator=(Program&& other) noexcept;

    /// Waits for the end: the exit status, or minus the signal's number.
    int Wait();
    /// Sends the signal, then waits.
    int Stop(int signal);
    bool IsRunning();
    pid_t Pid() const { return pid_; }

  private:
    pid_t pid_ = -1;
    int status_ = 0;
};

/// Runs a program to its end.
struct Outcome {
    int status;
    std::string output;  ///< standard output and error
};
Outcome RunProgram(const std::string& name, const std::vector<std::string>& arguments);

/// Asks `condition` again and again, for at most `limit`; whether it came true.
bool Eventually(const std::function<bool()>& condition,
                std::chrono::milliseconds limit = std::chrono::seconds(30));

/// Starts a daemon and waits until its socket answers.
Program StartDaemon(const std::string& name, const std::string& socket_path,
                    const std::vector<std::string>& arguments = {});

}  // namespace support
