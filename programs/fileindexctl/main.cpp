#include <fcntl.h>
#include <sys/ioctl.h>
#include <unistd.h>

#include <cerrno>
#include <csignal>
#include <cstdlib>
#include <ostream>
#include <string>
#include <vector>

#include "base/unique_fd.h"
#include "common/log.h"
#include "programs/fileindexctl/application.h"
#include "programs/fileindexctl/output.h"

int main(int argc, char** argv) {
    // A reader that goes away ends the output, not the command half-way through its work.
    std::signal(SIGPIPE, SIG_IGN);
    quivra::fileindex::log_level = 3;

    quivra::ctl::DescriptorBuffer buffer(STDOUT_FILENO);
    std::ostream out(&buffer);
    // A descriptor of its own: while services chatter, the standard one leads nowhere.
    const quivra::base::UniqueFd error(fcntl(STDERR_FILENO, F_DUPFD_CLOEXEC, STDERR_FILENO + 1));
    quivra::ctl::DescriptorBuffer error_buffer(error.IsValid() ? error.Get() : STDERR_FILENO);
    std::ostream err(&error_buffer);
    err << std::unitbuf;
    quivra::ctl::Session session{.out = out, .err = err};
    session.out_is_terminal = isatty(STDOUT_FILENO) == 1;
    winsize size{};
    if (ioctl(STDOUT_FILENO, TIOCGWINSZ, &size) == 0 && size.ws_col > 0 && size.ws_row > 0) {
        session.columns = size.ws_col;
        session.rows = size.ws_row;
    }

    const int status = quivra::ctl::Run(std::vector<std::string>(argv + 1, argv + argc), session);
    out.flush();
    if (session.given_up) {
        // Neither joins the thread that hangs nor destroys what it uses. Its locks end here.
        std::_Exit(status);
    }
    if (buffer.Error() != 0 && buffer.Error() != EPIPE) {
        err << "fileindexctl: cannot write the output: " << quivra::SystemErrorText(buffer.Error())
            << "\n";
        return quivra::ctl::kFailure;
    }
    return status;
}
