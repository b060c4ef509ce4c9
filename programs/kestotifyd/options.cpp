#include "programs/kestotifyd/options.h"

#include <CLI/CLI.hpp>
#include <map>

namespace kestotifyd {
namespace {

constexpr char kFooter[] = R"(
Registrations are picked up while it runs; each is one JSON file in the registration directory:
  {"queue": "/volume1/photo/@eaDir/fileindex/queue",
   "config": {"path": ["/volume1/photo"], "mask": 65478, "ignore": ["@eaDir"]}}

Examples:
  kestotifyd                         run, with the best back end of each file system
  kestotifyd --backend inotify       never mark whole file systems
  kestotifyd --verbose               say on standard error what is going on

Signals: SIGTERM and SIGINT write what is pending and stop; SIGHUP reads the registrations
again.)";

}  // namespace

std::optional<Options> ParseOptions(int argc, const char* const* argv, int& status) {
    Options options;
    CLI::App app{"Watches registered folders and writes what changes into their queue files.",
                 "kestotifyd"};
    const std::map<std::string, BackendChoice> choices{{"auto", BackendChoice::kAuto},
                                                       {"fanotify", BackendChoice::kFanotify},
                                                       {"inotify", BackendChoice::kInotify}};
    app.add_option("--backend", options.backend,
                   "How to learn of changes: fanotify (one mark per file system; Linux 5.17, "
                   "root), inotify (one watch per directory), or auto")
        ->transform(CLI::CheckedTransformer(choices).description("auto|fanotify|inotify"))
        ->default_str("auto");
    app.add_option("--registrations", options.registrations, "Directory of the registrations")
        ->capture_default_str();
    app.add_option("--max-watches", options.max_watches,
                   "Most directories to watch with inotify (default: 80 % of the system's limit)");
    quivra::daemon::AddOptions(app, options.common);
    app.footer(kFooter);
    if (const auto ended = quivra::daemon::Parse(app, argc, argv)) {
        status = *ended;
        return std::nullopt;
    }
    return options;
}

}  // namespace kestotifyd
