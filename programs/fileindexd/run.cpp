#include "programs/fileindexd/run.h"

#include <filesystem>
#include <system_error>

#include "programs/fileindexd/once.h"
#include "programs/fileindexd/resident.h"
#include "programs/fileindexd/worker.h"

namespace fileindexd {

namespace {

/// How a worker is started: by the program that runs, which an upgrade may have replaced at its
/// path.
std::vector<std::string> WorkerCommand(bool is_verbose) {
    std::error_code error;
    const std::filesystem::path program = std::filesystem::read_symlink("/proc/self/exe", error);
    std::vector<std::string> command = {error ? "/proc/self/exe" : program.string()};
    if (is_verbose) {
        command.push_back("--verbose");
    }
    command.push_back("--worker");
    return command;
}

}  // namespace

int Run(const Options& options) {
    if (!options.worker.empty()) {
        return RunWorker(options.worker);
    }
    if (!options.once.empty()) {
        return RunOnce(options.once);
    }
    RunResident(WorkerCommand(options.common.is_verbose));
    return 0;
}

}  // namespace fileindexd
