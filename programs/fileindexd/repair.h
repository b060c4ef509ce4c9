#pragma once

#include <string>

namespace fileindexd {

/// When the share is flagged as needing a reindex, queues one for each of its folders and takes the
/// flag back. It stays where that is not possible (yet), for lack of space for instance. Throws
/// quivra::Error.
void RepairIfNeeded(const std::string& share);

/// Queues a reindex of each of the share's folders. Throws quivra::Error.
void QueueReindex(const std::string& share);

}  // namespace fileindexd
