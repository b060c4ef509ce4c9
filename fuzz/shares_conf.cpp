#include <cstdint>
#include <string_view>

#include "base/path.h"
#include "platform/standalone/shares_conf.h"

namespace {

void Require(bool condition) {
    if (!condition) {
        __builtin_trap();
    }
}

}  // namespace

/// Whatever the file holds, a share that comes out is one that paths can be looked up in, and a
/// problem is one line that a terminal can show.
extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
    const kesto::SharesConf conf = kesto::ParseShares({reinterpret_cast<const char*>(data), size});
    for (const kesto::ShareConf& share : conf.shares) {
        Require(quivra::base::IsCanonicalText(share.path) && share.path != "/");
        Require(share.name == quivra::base::Name(share.path) && !share.name.empty());
        Require(kesto::FindShare(conf.shares, share.name) == &share);
        Require(kesto::FindShareOfPath(conf.shares, share.path + "/x/")->path == share.path);
        std::string_view users = share.users;
        while (kesto::NextUser(users)) {
        }
        Require(users.empty());
    }
    for (const std::string& problem : conf.problems) {
        Require(problem.starts_with(kesto::kSharesPath));
        for (const char c : problem) {
            Require(static_cast<unsigned char>(c) >= 0x20 && c != 0x7f);
        }
    }
    return 0;
}
