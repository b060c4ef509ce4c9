#include <cstddef>
#include <cstdint>
#include <cstdlib>
#include <string>

#include "base/path.h"
#include "common/error.h"
#include "common/json.h"
#include "common/log.h"
#include "programs/kestotifyd/registration.h"

// Any text as a registration's file: only Error may come out, and what is accepted is what the rest
// of the monitor relies on.
extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
    quivra::fileindex::log_level = 0;
    Json::Value description;
    if (!quivra::fromString(description, std::string(reinterpret_cast<const char*>(data), size))) {
        return 0;
    }
    try {
        const kestotifyd::Registration registration = kestotifyd::ParseRegistration(description);
        bool is_good = quivra::base::IsCanonicalText(registration.queue);
        for (const std::string& folder : registration.folders) {
            is_good = is_good && quivra::base::IsCanonicalText(folder);
        }
        if (!is_good) {
            std::abort();
        }
    } catch (const quivra::Error&) {
    }
    return 0;
}
