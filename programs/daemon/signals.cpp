#include "programs/daemon/signals.h"

#include <sys/signalfd.h>
#include <unistd.h>

#include <cerrno>
#include <csignal>

#include "common/error.h"
#include "common/log.h"

namespace quivra::daemon {

Signals::Signals(std::initializer_list<int> also) {
    sigset_t signals;
    sigemptyset(&signals);
    for (const int signal : {SIGTERM, SIGINT, SIGHUP}) {
        sigaddset(&signals, signal);
    }
    for (const int signal : also) {
        sigaddset(&signals, signal);
    }
    // A signal that is not blocked would be delivered, and a descriptor would never tell of it.
    pthread_sigmask(SIG_BLOCK, &signals, nullptr);
    fd_.Reset(signalfd(-1, &signals, SFD_CLOEXEC | SFD_NONBLOCK));
    if (!fd_.IsValid()) {
        Fail({"signals", __LINE__}, "!fd_.IsValid()",
             Error(Error::kSystemCallFailed, "signalfd failed: " + SystemErrorText(errno)));
    }
}

Signals::News Signals::Read() const {
    News news;
    signalfd_siginfo info;
    while (read(Fd(), &info, sizeof(info)) == sizeof(info)) {
        switch (info.ssi_signo) {
            case SIGTERM:
            case SIGINT:
                news.stop = true;
                break;
            case SIGHUP:
                news.reload = true;
                break;
            default:
                news.other = true;
        }
    }
    return news;
}

}  // namespace quivra::daemon
