#pragma once

#include <cstdint>
#include <optional>
#include <string>
#include <string_view>

#include "programs/kestotifyd/fanotify_translation.h"
#include "programs/kestotifyd/move_pairing.h"

namespace kestotifyd {

/// Takes the first event off `buffer`, which a read of an inotify descriptor has filled. None when
/// no whole event is left; a length that leads out of the buffer ends it, too.
std::optional<InotifyEvent> TakeInotifyEvent(std::string_view& buffer);

/// The same for a fanotify descriptor.
std::optional<FanotifyEvent> TakeFanotifyEvent(std::string_view& buffer);

}  // namespace kestotifyd
