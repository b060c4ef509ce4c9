#pragma once

#include <optional>

#include "programs/kestoelasticd/engine/sqlite/bitmap.h"
#include "programs/kestoelasticd/engine/sqlite/deadline.h"
#include "programs/kestoelasticd/engine/sqlite/plan.h"
#include "programs/kestoelasticd/engine/sqlite/tree.h"

namespace elasticd::engine::sqlite {

/// Finds the documents that a plan matches, as a connection sees them.
class Matcher {
  public:
    Matcher(::sqlite::Database& database, Tree& tree, const Deadline& deadline)
        : database_(database), tree_(tree), deadline_(deadline) {}

    Bitmap Match(const Plan& plan);

  private:
    const Bitmap& Everything();
    Bitmap MatchAll(const Plan& plan);
    Bitmap MatchWords(const Plan& plan);
    Bitmap MatchNames(const Plan& plan);
    Bitmap MatchChildren(const Plan& plan);
    Bitmap MatchBelow(const Plan& plan);
    bool Narrow(const Plan& plan, Bitmap& candidates);

    ::sqlite::Database& database_;
    Tree& tree_;
    const Deadline& deadline_;
    std::optional<Bitmap> everything_;
};

}  // namespace elasticd::engine::sqlite
