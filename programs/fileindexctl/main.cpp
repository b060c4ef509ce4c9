#include <sys/ioctl.h>
#include <unistd.h>

#include <cerrno>
#include <csignal>
#include <iostream>
#include <string>
#include <vector>

#include "common/log.h"
#include "programs/fileindexctl/application.h"
#include "programs/fileindexctl/output.h"

int main(int argc, char** argv) {
    // A reader that goes away ends the output, not the command half-way through its work.
    std::signal(SIGPIPE, SIG_IGN);
    quivra::fileindex::log_level = 3;

    quivra::ctl::DescriptorBuffer buffer(STDOUT_FILENO);
    std::ostream out(&buffer);
    quivra::ctl::Session session{.out = out, .err = std::cerr};
    session.out_is_terminal = isatty(STDOUT_FILENO) == 1;
    winsize size{};
    if (ioctl(STDOUT_FILENO, TIOCGWINSZ, &size) == 0 && size.ws_col > 0 && size.ws_row > 0) {
        session.columns = size.ws_col;
        session.rows = size.ws_row;
    }

    const int status = quivra::ctl::Run(std::vector<std::string>(argv + 1, argv + argc), session);
    out.flush();
    if (buffer.Error() != 0 && buffer.Error() != EPIPE) {
        std::cerr << "fileindexctl: cannot write the output: "
                  << quivra::SystemErrorText(buffer.Error()) << "\n";
        return quivra::ctl::kFailure;
    }
    return status;
}
