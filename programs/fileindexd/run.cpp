#include "programs/fileindexd/run.h"

#include <exception>
#include <filesystem>
#include <iostream>
#include <system_error>

#include "common/log.h"
#include "programs/fileindexd/once.h"
#include "programs/fileindexd/resident.h"
#include "programs/fileindexd/worker.h"

namespace fileindexd {

namespace {

constexpr int kLogLevelInfo = 6;

/// How a worker is started: by the program that runs.
std::vector<std::string> WorkerCommand(bool verbose) {
    std::error_code error;
    const std::filesystem::path program = std::filesystem::read_symlink("/proc/self/exe", error);
    std::vector<std::string> command = {error ? "/proc/self/exe" : program.string()};
    if (verbose) {
        command.push_back("--verbose");
    }
    command.push_back("--worker");
    return command;
}

}  // namespace

int Run(const Options& options) {
    quivra::fileindex::log_level =
        options.verbose ? quivra::fileindex::kLogLevelDebug : kLogLevelInfo;
    try {
        if (!options.worker.empty()) {
            return RunWorker(options.worker);
        }
        if (!options.once.empty()) {
            return RunOnce(options.once);
        }
        RunResident(WorkerCommand(options.verbose));
        return 0;
    } catch (const std::exception& error) {
        std::cerr << "fileindexd: " << error.what() << std::endl;
        return 1;
    }
}

}  // namespace fileindexd
