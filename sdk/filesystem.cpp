#include <kesto/filesystem.h>

#include "common/util.h"

// The two helpers of common/util.h that ask the platform. They lie here because common/ is below
// the platform's adapters and knows nothing of it.
namespace quivra {

bool CheckACLPerm(const std::string& path, int perm) {
    const int granted = KESTOACLPermGet(path.c_str());
    return granted >= 0 && (perm & granted) != 0;
}

bool IsMountPoint(const std::string& path) {
    return KESTOFSDirIsMntPoint(path.c_str()) > 0;
}

}  // namespace quivra
