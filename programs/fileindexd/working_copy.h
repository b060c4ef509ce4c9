#pragma once

#include <cstdint>
#include <optional>
#include <string>

namespace fileindexd {

/// Tells one working copy of a queue from another.
struct WorkingCopy {
    std::uint64_t inode = 0;
    std::uint64_t size = 0;
    std::int64_t modified = 0;  ///< nanoseconds since the epoch

    /// Of the file in the open directory. None when there is none.
    static std::optional<WorkingCopy> At(int directory, const std::string& name);

    /// A text that no other copy has.
    std::string Identity() const;
};

}  // namespace fileindexd
