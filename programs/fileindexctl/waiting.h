#pragma once

#include <functional>
#include <stdexcept>

#include "programs/fileindexctl/session.h"

namespace quivra::ctl {

/// A call that waited for a daemon was given up, because the daemon has gone. The text is the
/// cause, without what was being done.
struct GivenUp : std::runtime_error {
    using std::runtime_error::runtime_error;
};

enum class Needs {
    kIndexingDaemon,  ///< the call talks to fileindexd only
    kBothDaemons,     ///< to both daemons: it is given up when kestoelasticd ends, too
};

/// Makes a call of the library that may wait for daemons, without an end where they let it down:
/// the channel to the indexing daemon takes the end of the stream for a pause, and a busy search
/// daemon is asked again after a quarter of an hour.
///
/// The call runs in a thread of its own, so that its locks go with the process. What it throws is
/// thrown here. When a daemon that it needs has gone, GivenUp is thrown within two seconds; the
/// thread is left where it hangs and `session.given_up` says that the process has to end without
/// waiting for it. Therefore `call` holds copies of what it needs, not references. A wait of ten
/// seconds is told once, on the error stream.
void WaitFor(Session& session, Needs needs, std::function<void()> call);

}  // namespace quivra::ctl
