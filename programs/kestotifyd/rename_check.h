#pragma once

#include <cstddef>
#include <string>
#include <vector>

#include "programs/kestotifyd/backend.h"

namespace kestotifyd {

/// Compares what renames have led to with the disk, once the kernel's queue is empty. For their
/// events alone can mislead: the kernel merges equal ones (of a -> b, b -> a, a -> b the first two
/// arrive, and the object seems to be at a), and an exchange of a and b arrives as a -> b, b -> a,
/// which looks like a move to and fro.
class RenameCheck {
  public:
    /// So many are compared in one go: each costs two look-ups on the disk.
    static constexpr std::size_t kMaxRenames = 1024;

    void Add(const Change& rename);
    bool IsFull() const { return renames_.size() >= kMaxRenames; }

    /// Reports what is not as the renames since the last call have left it. With `were_names_early`
    /// events have been reported under names that only a later rename gave: then the result of
    /// every rename is indexed again, also of those before the last call, because the event of a
    /// rename is queued a moment after the disk shows it.
    void Run(BackendSink& sink, bool were_names_early);

  private:
    struct Rename {
        std::string from;
        std::string to;
        bool is_dir;
    };

    std::vector<Rename> renames_;
    std::vector<Rename> renames_before_;
};

}  // namespace kestotifyd
