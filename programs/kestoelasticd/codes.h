#pragma once

#include "fileindex/elastic/protocol.h"

namespace elasticd {

/// The codes that failed requests are answered with; docs/search-daemon.md tells what to do.
using enum quivra::fileindex::elastic::Code;

/// Whether a change was refused before anything was done: the batch is as it was.
inline bool IsRefusal(int code) {
    return code == kNoSuchDocument || code == kBadDocument || code == kBadQuery;
}

}  // namespace elasticd
