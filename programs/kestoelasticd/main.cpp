#include <CLI/CLI.hpp>

#include "programs/kestoelasticd/daemon.h"

int main(int argc, char** argv) {
    elasticd::DaemonOptions options;
    CLI::App app("The search daemon: keeps one search index per share and answers queries on it");
    app.add_option("--socket", options.socket, "The Unix socket to listen on")
        ->capture_default_str();
    app.add_option("--state-dir", options.service.state_directory,
                   "Where the list of indexes is kept")
        ->capture_default_str();
    app.add_option("--min-free-space", options.service.min_free_space,
                   "Refuse new documents when less is free where their index lies")
        ->transform(CLI::AsSizeValue(false))
        ->capture_default_str();
    app.add_flag("--verbose,-v", options.verbose, "Log to standard error as well");
    try {
        app.parse(argc, argv);
    } catch (const CLI::ParseError& error) {
        return app.exit(error) == 0 ? 0 : 2;
    }
    return elasticd::RunDaemon(options);
}
