#include <CLI/CLI.hpp>

#include "programs/daemon/program.h"
#include "programs/fileindexd/run.h"

namespace {

constexpr const char* kExamples = R"(
Examples:
  fileindexd                     run the daemon in the foreground
  fileindexd --once photo music  process the pending changes of two shares, then exit

The exit status is 0, 1 when something failed, 2 for a wrong call.
)";

}  // namespace

int main(int argc, char** argv) {
    fileindexd::Options options;
    CLI::App app("Carries file changes out on the search index, share by share.", "fileindexd");
    CLI::Option* once =
        app.add_option("--once", options.once, "Process what these shares' queues hold, then exit");
    once->type_name("SHARE");
    app.add_option("--worker", options.worker)->group("");  // how the daemon starts its workers
    quivra::daemon::AddOptions(app, options.common);
    app.footer(kExamples);
    if (const auto status = quivra::daemon::Parse(app, argc, argv)) {
        return *status;
    }
    return quivra::daemon::RunProgram("fileindexd", options.common,
                                      [&] { return fileindexd::Run(options); });
}
