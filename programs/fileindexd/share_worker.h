#pragma once

#include <chrono>
#include <functional>
#include <memory>
#include <optional>
#include <stdexcept>
#include <string>

#include "programs/fileindexd/catch_up.h"
#include "programs/fileindexd/elastic_index.h"
#include "programs/fileindexd/pass.h"
#include "programs/fileindexd/state_file.h"

namespace fileindexd {

/// Something stands where the share's queue should be that somebody has to take away. what() is a
/// sentence that says so.
class PlaceProblem : public std::runtime_error {
    using std::runtime_error::runtime_error;
};

/// Runs passes over one share's queue and slices of its backlog, one process at a time, and keeps
/// the state file. `between` is called between two operations and may throw Stopped.
class ShareWorker {
  public:
    explicit ShareWorker(std::string share);

    /// Opens the private directory in which the queue lies, and the backlog there. Where they are
    /// open, looks whether they are still the ones at the path. Throws PlaceProblem, sqlite::Error,
    /// Error 502 (also where they have been replaced) or what looking the share up does; nothing is
    /// open then.
    void Open();
    void Close() { place_.reset(); }
    bool IsOpen() const { return place_ != nullptr; }
    /// Of the open place.
    const quivra::base::PrivateDirectory& Directory() const { return place_->directory; }
    std::string QueueName() const;

    /// One pass (see Pass::Run), for which the share is looked up and the folder set read afresh.
    /// Waits while another process is at work on the share. Throws what Pass::Run and Open do;
    /// administrators have been notified when it was for lack of space, once until a pass succeeds
    /// again.
    PassResult RunPass(const std::function<void()>& between = {});

    /// One slice of the backlog; not to be called while a pass is owed. Throws as RunPass does.
    /// Returns what it did.
    CatchUp::Slice RunSlice(const std::function<void()>& between = {});

    /// How long until something of the backlog is due; none when nothing is waiting there.
    std::optional<std::chrono::seconds> NextSlice();

    /// Files that could not be read are tried again now.
    void RetryFailures();

    /// Asks the search daemon whether the index is a new one; then everything is indexed again.
    void CheckIndex();

    StateFile& State() { return state_; }
    /// Brings what the state file says of the backlog up to date.
    void ShowWaiting();

  private:
    struct Place {
        Place(quivra::base::PrivateDirectory opened, std::string queue)
            : directory(std::move(opened)),
              queue_path(std::move(queue)),
              backlog(directory),
              catch_up(backlog) {}

        quivra::base::PrivateDirectory directory;
        std::string queue_path;
        Backlog backlog;
        CatchUp catch_up;
    };

    /// Runs the work under the share's lock, and deals with what it throws.
    template <typename Function>
    auto Guard(const std::function<void()>& between, Function work);
    void NoteFailure(const std::string& error);
    PassResult RunLocked(const std::function<void()>& between);
    CatchUp::Slice RunSliceLocked(const std::function<void()>& between);
    void Begin(const std::string& root, const Scope& scope);
    void ReindexAll(const std::string& why);
    PassListener Listener(const std::function<void()>& between);
    void NoteRate(const CatchUp::Slice& slice, CatchUp::Clock::time_point begin);

    const std::string share_;
    StateFile state_;
    ElasticIndex index_;
    std::unique_ptr<Place> place_;
    bool space_notified_ = false;
    bool was_checked_ = false;  ///< the rules against those of the last pass

    // For the estimate: what was done lately, and in which time.
    double weight_done_ = 0;
    double seconds_taken_ = 0;
    CatchUp::Clock::time_point last_slice_{};
    CatchUp::Clock::time_point next_show_{};
};

}  // namespace fileindexd
