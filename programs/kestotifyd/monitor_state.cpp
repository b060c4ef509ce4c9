#include <algorithm>

#include "base/path.h"
#include "programs/kestotifyd/fanotify_backend.h"
#include "programs/kestotifyd/monitor.h"

namespace kestotifyd {
namespace {

/// The share that a queue belongs to: what lies above the platform's own directory.
std::string ShareOf(const std::string& queue) {
    const std::size_t own = queue.find("/@eaDir/");
    return own == std::string::npos ? std::string(quivra::base::Directory(queue))
                                    : queue.substr(0, own);
}

}  // namespace

Json::Value Monitor::State() const {
    Json::Value state(Json::objectValue);
    // One root that needs a watch for each directory is what limits apply to.
    const bool uses_inotify = std::any_of(roots_.begin(), roots_.end(), [&](const auto& entry) {
        return entry.second.backend != nullptr && entry.second.backend == inotify_.get();
    });
    state["backend"] =
        uses_inotify || options_.backend == BackendChoice::kInotify ? "inotify" : "fanotify";
    state["folders"] = Json::Value(Json::arrayValue);
    for (const QueueSet::State& queue : queues_.States()) {
        state["folders"].append(StateOf(queue));
    }
    Json::UInt64 overflows = 0;
    for (const Backend* const backend : {inotify_.get(), fanotify_.get()}) {
        overflows += backend == nullptr ? 0 : backend->Overflows();
    }
    state["overflows"] = overflows;
    const auto age = std::chrono::duration_cast<std::chrono::seconds>(
        Clock::now() - last_event_.value_or(Clock::now()));
    state["last_event"] = last_event_ ? Json::Int64{age.count()} : Json::Int64{-1};
    state["problem"] = registration_problem_;
    return state;
}

Json::Value Monitor::StateOf(const QueueSet::State& queue) const {
    Backend::Coverage sum;
    sum.problem = queue.problem;
    for (const auto& [path, root] : roots_) {
        const bool concerns =
            std::any_of(queue.registration.folders.begin(), queue.registration.folders.end(),
                        [&, &path = path](const std::string& folder) {
                            return quivra::base::IsAtOrBelow(path, folder) ||
                                   quivra::base::IsAtOrBelow(folder, path);
                        });
        if (!concerns || !wanted_roots_.contains(path)) {
            continue;
        }
        const Backend::Coverage coverage = root.backend == nullptr
                                               ? Backend::Coverage{0, 1, root.problem}
                                               : root.backend->CoverageOf(path);
        sum.watched += coverage.watched;
        sum.unwatched += coverage.unwatched;
        if (sum.problem.empty()) {
            sum.problem = coverage.problem;
        }
    }
    Json::Value state(Json::objectValue);
    state["queue"] = queue.registration.queue;
    state["share_path"] = ShareOf(queue.registration.queue);
    state["watched"] = Json::UInt64{sum.watched};
    state["unwatched"] = Json::UInt64{sum.unwatched};
    state["problem"] = sum.problem;
    return state;
}

}  // namespace kestotifyd
