#pragma once

#include <string>

#include "programs/fileindexd/pass.h"
#include "programs/fileindexd/state_file.h"

namespace fileindexd {

/// Runs passes over one share's queue, one process at a time, and keeps the state file.
class ShareWorker {
  public:
    explicit ShareWorker(std::string share);

    /// One pass (see Pass::Run), for which the share is looked up and the folder set read afresh.
    /// `between` is called between two operations and may throw Stopped. Waits while another
    /// process is at work on the share. Throws what Pass::Run does; administrators have been
    /// notified when it was for lack of space, once until a pass succeeds again.
    PassResult RunPass(const std::function<void()>& between = {});

    StateFile& State() { return state_; }

  private:
    PassResult RunLocked(const std::function<void()>& between);

    const std::string share_;
    StateFile state_;
    bool space_notified_ = false;
};

}  // namespace fileindexd
