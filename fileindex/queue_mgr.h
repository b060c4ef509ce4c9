#pragma once

#include <json/json.h>

#include <functional>
#include <memory>
#include <string>
#include <vector>

#include "common/export.h"
#include "fileindex/optree.h"

namespace quivra::fileindex {

/// One share's queue file and its working copy.
///
/// Writers append events to the queue file. A pass first renames it to the working copy, so that
/// new events gather in a fresh file, carries out what the copy holds, and then deletes the copy.
/// A pass that was interrupted leaves the copy, which the next pass processes before it touches
/// the queue again: no event is lost, some may be carried out twice.
///
/// Writers hold an exclusive LockFile on the queue file while they append. A failure of any call
/// leaves both files as they were.
///
/// Both files of a share lie below "@eaDir", in a directory that users may exchange. They are used
/// only while "@eaDir" and what is below belong to root or the effective user and nobody else may
/// write there; else the calls throw, with a sentence that says what stands in the way. A link or
/// FIFO in the place of a file counts as no file and is never followed or waited for.
class QUIVRA_EXPORT QueueMgr {
  public:
    /// Nothing is opened; the working copy is `queue_path` with ".tmp" behind it.
    explicit QueueMgr(const std::string& queue_path);

    /// Moves the queue to the working copy, unless there is no queue or still a working copy.
    /// Waits for the queue's lock. Throws Error 506 (lock) or 502 (rename).
    void PrepareTmpQueue();

    /// Appends an event, as one line in the form that Event reads, under the queue's lock; a queue
    /// that is missing is made, a last line that lacks its end gets one first. Throws Error 506
    /// (lock) or 502; the queue is as it was then.
    void Append(const Json::Value& event) const;
    /// The same for several events, under one lock. After a failure the first of them may be in the
    /// queue, each whole.
    void AppendAll(const std::vector<Json::Value>& events) const;

    /// A new tree of the queue or of the working copy. Throws Error 502 when it cannot be read.
    std::shared_ptr<OPTree> GetOPTree() const;
    std::shared_ptr<OPTree> GetOPTreeTmp() const;

    /// Deletes the working copy, once everything in it has been carried out. Returns unlink's
    /// result: 0, or -1 with errno set.
    int DeleteTmp();

    /// Hands the pending ops to `fn`. With `use_tmp` those of the working copy, after
    /// PrepareTmpQueue; the copy stays until DeleteTmp. Else those of the queue, which stays in
    /// place. Returns OPTree::ProcessOP's count; 0 when there is no file. Errors of PrepareTmpQueue
    /// and of the tree, and what `fn` throws, pass through.
    int ProcessOP(const std::function<void(std::shared_ptr<OP>)>& fn, bool use_tmp);

    /// Whether a pending event touches the path or anything below it. Reads queue and working copy
    /// without the lock, so an event appended meanwhile may be missed. Throws Error 502 when one
    /// cannot be read, the error of the first malformed line before a match, and what FolderMgr
    /// throws when the set of folders cannot be read.
    bool IsFullPathProcessing(const std::string& full_path) const;

    /// Whether a reindex of the path or of one of its ancestors is pending: an event that has that
    /// bit and no other. Else as IsFullPathProcessing.
    bool IsFullPathHasReindex(const std::string& full_path) const;

  private:
    std::string queue_path_;
    std::string queue_path_tmp_;
};

}  // namespace quivra::fileindex
