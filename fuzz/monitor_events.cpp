#include <cstddef>
#include <cstdint>
#include <cstdlib>
#include <string>
#include <string_view>

#include "base/path.h"
#include "common/log.h"
#include "fileindex/event.h"
#include "programs/kestotifyd/inotify_translation.h"
#include "programs/kestotifyd/queue_translator.h"
#include "programs/kestotifyd/raw_events.h"

namespace {

using namespace kestotifyd;

QueueTranslator MakeTranslator() {
    return QueueTranslator({"/r/@eaDir/queue", {"/r", "/q"}, 65478, {"skip"}},
                           [](const std::string& name) { return name == "@eaDir"; });
}

/// Every line can be read, and concerns one of the folders.
void CheckLines(QueueTranslator& translator) {
    translator.Flush(Time::max());
    for (const std::string& line : translator.TakeLines()) {
        const quivra::fileindex::Event event(line);
        if (!quivra::base::IsAtOrBelow(event.path, "/r") &&
            !quivra::base::IsAtOrBelow(event.path, "/q")) {
            std::abort();
        }
    }
}

/// Whatever a read of an inotify descriptor may give, over a small tree that grows by what appears.
void Inotify(std::string_view buffer) {
    QueueTranslator translator = MakeTranslator();
    MovePairing pairing;
    WatchTree tree;
    WatchNode* const root = tree.AddRoot("/r", 1);
    tree.AddChild(*tree.AddChild(*root, "d", 2), "sub", 3);
    tree.AddChild(*tree.AddRoot("/q", 4), "d", 2);  // seen at two places
    while (std::optional<InotifyEvent> event = TakeInotifyEvent(buffer)) {
        event->wd &= 7;
        pairing.Push(std::move(*event), Time());
    }
    int next_wd = 5;
    while (const auto paired = pairing.Pop(Time::max())) {
        const InotifyOutcome outcome = TranslateInotify(*paired, tree);
        for (const Change& change : outcome.changes) {
            translator.Apply(change, Time());
        }
        for (const auto& [parent, name] : outcome.appeared) {
            if (tree.IsAlive(parent) && parent.node->Child(name) == nullptr) {
                tree.AddChild(*parent.node, name, next_wd++ & 7);
            }
        }
    }
    for (const std::string& path : tree.RootPaths()) {
        WatchTree::Count(*tree.FindRoot(path));
    }
    CheckLines(translator);
}

/// The same for a fanotify descriptor: a handle's last byte chooses where its directory is.
void Fanotify(std::string_view buffer) {
    constexpr const char* kPlaces[] = {"", "/r", "/r/a", "/r/a/b", "/r/c", "/q", "/q/a", "/other"};
    QueueTranslator translator = MakeTranslator();
    HandlePaths paths;
    const auto lookup = [&](const std::string& handle) {
        const std::string known = paths.Find(handle);
        const std::string path = !known.empty() ? known : kPlaces[handle.back() & 7];
        if (known.empty() && !path.empty()) {
            paths.Set(handle, path);
        }
        return path;
    };
    while (const std::optional<FanotifyEvent> event = TakeFanotifyEvent(buffer)) {
        for (const Change& change : TranslateFanotify(*event, paths, lookup)) {
            translator.Apply(change, Time());
        }
        if (event->mask % 5 == 0) {
            paths.Settle();
        }
    }
    CheckLines(translator);
}

}  // namespace

// What both back ends make of the bytes that the kernel gives them.
extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
    quivra::fileindex::log_level = 0;
    const std::string_view text(reinterpret_cast<const char*>(data), size);
    if (!text.empty()) {
        text.front() == 'i' ? Inotify(text.substr(1)) : Fanotify(text.substr(1));
    }
    return 0;
}
