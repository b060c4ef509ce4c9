// A request to the indexing daemon: a command, or an error with a reason.

#include <cstddef>
#include <cstdint>
#include <cstdlib>
#include <string>

#include "common/error.h"
#include "programs/fileindexd/commands.h"

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
    try {
        const fileindexd::Command command =
            fileindexd::ParseCommand(std::string(reinterpret_cast<const char*>(data), size));
        // It becomes part of a file's name.
        if (command.share.find('/') != std::string::npos || command.share == "..") {
            std::abort();
        }
    } catch (const quivra::Error& error) {
        fileindexd::ErrorReply(error.code, error.reason);
    }
    return 0;
}
