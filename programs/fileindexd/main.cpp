#include <CLI/CLI.hpp>

#include <exception>
#include <iostream>
#include <string>
#include <vector>

#include "common/log.h"
#include "programs/fileindexd/once.h"
#include "programs/fileindexd/resident.h"
#include "programs/fileindexd/worker.h"

namespace {

constexpr const char* kExamples = R"(
Examples:
  fileindexd                     run the daemon in the foreground
  fileindexd --once photo music  process the pending changes of two shares, then exit
)";

}  // namespace

int main(int argc, char** argv) {
    CLI::App app("Carries file changes out on the search index, share by share.", "fileindexd");
    std::vector<std::string> once;
    std::string worker;
    bool verbose = false;
    app.add_option("--once", once, "Process what the queues of these shares hold, then exit")
        ->type_name("SHARE");
    app.add_option("--worker", worker)->group("");  // how the daemon starts its workers
    app.add_flag("--verbose", verbose, "Log every change event");
    app.footer(kExamples);
    try {
        app.parse(argc, argv);
    } catch (const CLI::ParseError& error) {
        return app.exit(error) == 0 ? 0 : 2;
    }
    quivra::fileindex::log_level = verbose ? quivra::fileindex::kLogLevelDebug : 6;
    try {
        if (!worker.empty()) {
            return fileindexd::RunWorker(worker);
        }
        if (!once.empty()) {
            return fileindexd::RunOnce(once);
        }
        std::vector<std::string> command{"/proc/self/exe", "--worker"};
        if (verbose) {
            command.insert(command.begin() + 1, "--verbose");
        }
        fileindexd::RunResident(command);
        return 0;
    } catch (const std::exception& error) {
        std::cerr << "fileindexd: " << error.what() << std::endl;
        return 1;
    }
}
