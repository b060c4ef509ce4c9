#pragma once

#include <functional>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "programs/kestoelasticd/engine/sqlite/tree.h"

namespace elasticd::engine::sqlite {

/// Goes through documents in the order of their ids' bytes, which is not quite a tree's: "/a-b"
/// stands between "/a" and "/a/b". So a directory's children wait until the names that begin as its
/// own does, and go on with something below "/", have been.
class PathWalk {
  public:
    /// `take` returns false to end the walk.
    using Take = std::function<bool(const std::string& path, std::int64_t id)>;

    PathWalk(Tree& tree, Take take) : tree_(tree), take_(std::move(take)) {}

    /// Everything in the directory `top`, whose path, with its "/" (empty for the root), is
    /// `prefix`; only what comes behind `after`, a whole id, unless that is empty.
    void Run(std::int64_t top, std::string prefix, std::string_view after);

  private:
    struct Waiting {
        std::int64_t id;
        std::string name;
        std::optional<std::string> after;  ///< within that directory; none: all of it
    };

    bool Directory(std::int64_t parent, std::optional<std::string_view> after);
    bool TakeWaiting(std::vector<Waiting>& waiting, std::string_view next_name);
    void WaitForBegun(std::int64_t parent, std::string_view after, std::vector<Waiting>& waiting);

    Tree& tree_;
    const Take take_;
    std::string path_;  ///< of the directory at hand, with its "/"
};

}  // namespace elasticd::engine::sqlite
