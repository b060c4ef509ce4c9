#include <syslog.h>

#include <CLI/CLI.hpp>
#include <cstdio>
#include <exception>

#include "programs/kestokosnotify/notice.h"

namespace {

int Run(int argc, char** argv) {
    notify::Notice notice;
    bool shows_on_desktop = true;
    bool sends_mail = false;
    CLI::App app(
        "Tells administrators about trouble: in the system log and on the terminals where they "
        "are logged in.\n\nExample: kestokosnotify -c KESTO.Quivra.Application @administrators "
        "app:displayname error:lack_of_memory");
    app.add_option("-c", notice.application, "The application that the notice comes from")
        ->required();
    // What the desktop's own tool takes too; there is no desktop and no mail here.
    app.add_option("-b", shows_on_desktop, "Ignored");
    app.add_option("-e", sends_mail, "Ignored");
    app.add_option("recipient", notice.recipient, "A user, or @administrators")->required();
    app.add_option("title", notice.title, "Key of the title")->required();
    app.add_option("message", notice.message, "Key of the message")->required();
    app.add_option("arguments", notice.arguments, "Texts for the message's places");
    try {
        app.parse(argc, argv);
    } catch (const CLI::ParseError& error) {
        return app.exit(error) == 0 ? 0 : 2;
    }
    openlog("kestokosnotify", LOG_PID, LOG_DAEMON);
    notify::Send(notice);
    return 0;
}

}  // namespace

int main(int argc, char** argv) {
    try {
        return Run(argc, argv);
    } catch (const std::exception& error) {
        std::fprintf(stderr, "kestokosnotify: %s\n", error.what());
        return 1;
    }
}
