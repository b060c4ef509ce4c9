#pragma once

#include <string_view>

namespace kesto {

/// What statfs reports for every FUSE file system, whatever is behind it.
inline constexpr unsigned long kFuseMagic = 0x65735546;

/// The type code (KESTO_FS_*) for what statfs reports.
int TypeCode(unsigned long magic);

/// The type code of a FUSE file system from its name in the mount table ("fuse.sshfs").
int FuseTypeCode(std::string_view name);

}  // namespace kesto
