#pragma once

#include <chrono>
#include <string>
#include <vector>

#include "programs/fileindexd/index.h"

namespace fileindexd {

/// A file to be sent with its content, and what came of it.
struct Extraction {
    enum class Outcome {
        kNotTried,  ///< the time was over
        kDone,
        kRefused,  ///< `reason` and `can_pass` tell why
    };

    std::string path;
    bool need_meta = true;
    Outcome outcome = Outcome::kNotTried;
    std::string reason;
    bool can_pass = false;
};

/// Sends the files to the index, several at a time: reading and extracting one waits for the disk
/// or for its parser while another is sent. The order among them means nothing, because each is a
/// path of its own. Begins no file after `until`, except the first. Throws what the index throws
/// for reasons of its own, once all have come to rest.
void Extract(Index& index, std::vector<Extraction>& files,
             std::chrono::steady_clock::time_point until);

}  // namespace fileindexd
