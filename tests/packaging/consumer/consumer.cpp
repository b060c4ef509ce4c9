// A program outside the tree: prints what is pending in a queue.
#include <iostream>

#include "common/error.h"
#include "common/log.h"
#include "fileindex/queue_mgr.h"

int main(int argc, char** argv) {
    quivra::fileindex::log_level = 0;
    try {
        quivra::fileindex::QueueMgr queue(argc > 1 ? argv[1] : "");
        const int consumed = queue.ProcessOP(
            [](std::shared_ptr<quivra::fileindex::OP> op) { std::cout << op << "\n"; }, false);
        std::cout << "consumed: " << consumed << "\n";
    } catch (const quivra::Error& error) {
        std::cerr << error.what() << "\n";
        return 1;
    }
    return 0;
}
