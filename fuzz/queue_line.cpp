#include <cstddef>
#include <cstdint>
#include <cstdlib>
#include <sstream>
#include <string>

#include "common/error.h"
#include "common/log.h"
#include "fileindex/optree.h"

// Any text, line by line, into one tree: only Error may come out, and all that is kept can be
// printed, processed and freed.
extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
    using namespace quivra::fileindex;
    log_level = 0;
    OPTree tree("/dev/null");
    std::istringstream lines(std::string(reinterpret_cast<const char*>(data), size));
    for (std::string line; std::getline(lines, line);) {
        try {
            tree.InsertEvent(std::make_shared<Event>(line));
        } catch (const quivra::Error&) {
        }
    }
    int surviving = 0;
    std::ostringstream printed;
    const int consumed = tree.ProcessOP([&](const std::shared_ptr<OP>& op) {
        printed << op;
        ++surviving;
    });
    if (surviving > consumed) {
        std::abort();
    }
    tree.TraverseNodeDescendant(
        tree.root, [&](const std::shared_ptr<OPNode>& node) { printed << node; }, false);
    return 0;
}
