#pragma once

#include <string>

/// The library's operations on shares and volumes pass over what does not concern them, and report
/// success. These ask first whether there is anything to do, and throw Failure with the reason when
/// there is not; what the library throws passes through.
namespace quivra::ctl {

void PauseShare(const std::string& share);
void ResumeShare(const std::string& share);

/// Forgets the share: the worker and the registration with the file monitor first, so that nothing
/// fills or reads the queue that goes. `path` is the root that it has, or had.
void ClearShare(const std::string& share, const std::string& path);

/// `from` may not exist any more.
void RenameShare(const std::string& from, const std::string& to);

/// `path` is the root that the share had; its index knows.
void MigrateShare(const std::string& share, const std::string& path);

void CheckRecycleBin(const std::string& share);

void PauseVolume(const std::string& mount_point);
void ResumeVolume(const std::string& mount_point);
void ClearVolume(const std::string& mount_point);

}  // namespace quivra::ctl
