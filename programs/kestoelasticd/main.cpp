#include <CLI/CLI.hpp>

#include "programs/daemon/program.h"
#include "programs/kestoelasticd/daemon.h"

int main(int argc, char** argv) {
    elasticd::DaemonOptions options;
    quivra::daemon::CommonOptions common;
    common.state_directory = options.service.state_directory;
    CLI::App app("The search daemon: keeps one search index per share and answers queries on it",
                 "kestoelasticd");
    app.add_option("--socket", options.socket, "The Unix socket to listen on")
        ->capture_default_str();
    app.add_option("--min-free-space", options.service.min_free_space,
                   "Refuse new documents when less is free where their index lies")
        ->transform(CLI::AsSizeValue(false))
        ->capture_default_str();
    quivra::daemon::AddOptions(app, common);
    if (const auto status = quivra::daemon::Parse(app, argc, argv)) {
        return *status;
    }
    options.service.state_directory = common.state_directory;
    return quivra::daemon::RunProgram("kestoelasticd", common,
                                      [&] { return elasticd::RunDaemon(options); });
}
