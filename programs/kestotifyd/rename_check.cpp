#include "programs/kestotifyd/rename_check.h"

#include <sys/stat.h>

#include <utility>

namespace kestotifyd {

void RenameCheck::Add(const Change& rename) {
    renames_.push_back({rename.path_old, rename.path, rename.is_dir});
}

void RenameCheck::Run(BackendSink& sink, bool were_names_early) {
    using Kind = Change::Kind;
    // Not for directories alone: two exchanged files look like one that was moved to and fro.
    for (const Rename& rename : renames_) {
        struct stat status {};
        if (lstat(rename.to.c_str(), &status) != 0) {
            sink.OnChange({Kind::kDeleted, rename.is_dir, rename.to});
        }
        if (lstat(rename.from.c_str(), &status) == 0) {
            sink.OnChange({Kind::kCreated, S_ISDIR(status.st_mode), rename.from});
        }
    }
    if (were_names_early) {
        for (const std::vector<Rename>* const some : {&renames_before_, &renames_}) {
            for (const Rename& rename : *some) {
                sink.OnChange({Kind::kReindex, true, rename.to});
            }
        }
    }
    renames_before_ = std::exchange(renames_, {});
}

}  // namespace kestotifyd
