#pragma once

#include <string>

#include "base/private_directory.h"
#include "base/unique_fd.h"

namespace quivra::fileindex {

/// The directory of a queue, held by descriptor for the length of one operation. Below a share's
/// "@eaDir", where users may exchange directories at any time, it is opened as a private directory
/// (base/private_directory.h) and refused where it is not one. A queue at any other place is its
/// caller's choice and opened like any file.
class QueueDirectory {
  public:
    explicit QueueDirectory(const std::string& queue_path);

    bool IsValid() const { return private_.IsValid() || plain_.IsValid(); }
    /// What the names of files are relative to.
    int Fd() const { return private_.IsValid() ? private_.Fd() : plain_.Get(); }

    /// Whether it is not valid because there is none, so that nothing can wait in it.
    bool IsMissing() const;

    /// Why it is not valid: what stands in the way, as a sentence, or the text of errno.
    std::string Reason() const;

    const std::string& QueueName() const { return queue_name_; }
    const std::string& CopyName() const { return copy_name_; }

    /// Whether a regular file of that name is there; false where the directory is not valid.
    bool HasFile(const std::string& name) const;

    /// Opens the file at the path, a queue or a working copy, for reading. Not valid, with errno
    /// set, when that fails. Below "@eaDir" links, FIFOs and the like are refused without waiting.
    static base::UniqueFd OpenFile(const std::string& path);

  private:
    base::PrivateDirectory private_;
    base::UniqueFd plain_;
    int error_ = 0;  // errno of a failed opening
    std::string queue_name_;
    std::string copy_name_;
};

}  // namespace quivra::fileindex
