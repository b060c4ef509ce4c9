#include "programs/fileindexd/renames.h"

#include <algorithm>
#include <set>
#include <string_view>
#include <utility>

#include "base/path.h"
#include "common/util.h"

namespace fileindexd {

namespace {

constexpr std::size_t kListPage = 20000;

/// One end of a rename. With "/" behind the path, every path sorts right before what lies below.
struct End {
    std::string key;
    std::size_t rename;
    bool is_to;
};

std::vector<End> SortedEnds(const std::vector<Rename>& renames) {
    std::vector<End> ends;
    ends.reserve(2 * renames.size());
    for (std::size_t i = 0; i < renames.size(); ++i) {
        ends.push_back({renames[i].from + "/", i, false});
        ends.push_back({renames[i].to + "/", i, true});
    }
    std::sort(ends.begin(), ends.end(), [](const End& a, const End& b) {
        return std::tie(a.key, a.rename, a.is_to) < std::tie(b.key, b.rename, b.is_to);
    });
    return ends;
}

/// Deals with the ends at one path, [begin, end) in queue order. What a rename put there is lost
/// when a later one moves documents to the same place, or is carried on when a later one moves them
/// away from it: except when that later one has no documents to move.
void PlanCommonEnds(std::vector<Rename>& renames, std::vector<End>::const_iterator begin,
                    std::vector<End>::const_iterator end,
                    const std::function<bool(const std::string&)>& has_documents) {
    std::vector<std::size_t> put_here;
    std::size_t distrusted = 0;  // how many of these are known not to be trusted
    for (auto it = begin; it != end; ++it) {
        Rename& rename = renames[it->rename];
        if (!put_here.empty()) {
            if (!has_documents(rename.from)) {
                rename.plan = Rename::Plan::kNone;
                continue;
            }
            rename.plan = Rename::Plan::kReplace;
            for (; distrusted < put_here.size(); ++distrusted) {
                renames[put_here[distrusted]].plan = Rename::Plan::kReplace;
            }
        }
        if (it->is_to) {
            put_here.push_back(it->rename);
        }
    }
}

/// Each rename once: saving a file by renaming a temporary one repeats the same pair.
void RemoveRepeats(std::vector<Rename>& renames) {
    std::set<std::pair<std::string, std::string>> seen;
    std::erase_if(renames, [&](const Rename& rename) {
        return !seen.emplace(rename.from, rename.to).second;
    });
}

/// Moves the topmost documents below `from`, which has none of its own.
bool RenameBelow(const Rename& rename, Batch& batch, Index& index) {
    bool moved = false;
    std::string top;
    std::string last;
    for (;;) {
        const std::vector<Document> page = index.ListBelow(rename.from, last, kListPage);
        for (const Document& document : page) {
            // What lies below it has moved along.
            if (top.empty() || !quivra::base::IsBelow(document.path, top)) {
                top = document.path;
                moved |= batch.Rename(quivra::base::Moved(top, rename.from, rename.to), top);
            }
        }
        if (page.size() < kListPage) {
            return moved;
        }
        last = page.back().path;
    }
}

/// Whether the documents say the same at the new place as they did at the old one.
bool StayValid(const Rename& rename, bool is_dir, const ShareTree& tree, const Scope& scope) {
    if (!quivra::base::IsAtOrBelow(rename.from, tree.Root())) {
        return true;  // the whole share has moved, and its folders with it
    }
    if (is_dir) {
        return scope.HaveSameRules(rename.from, rename.to);
    }
    return scope.NeedsMeta(rename.from) == scope.NeedsMeta(rename.to) &&
           quivra::GetFileExtension(rename.from, true) == quivra::GetFileExtension(rename.to, true);
}

/// Whether the object, or of a directory something in it, is to be indexed.
bool IsCovered(const std::string& path, bool is_dir, const Scope& scope) {
    return is_dir ? !scope.RootsWithin(path).empty() : scope.Covers(path, false);
}

/// The last word on a plan, now that the disk is looked at.
void CheckPlan(Rename& rename, Batch& batch, const ShareTree& tree, const Scope& scope) {
    std::optional<Attributes> there;
    if (rename.plan != Rename::Plan::kMove) {
        return;
    }
    if (!batch.Look(there, rename.to) || !there || !IsCovered(rename.to, there->is_dir, scope)) {
        rename.plan = Rename::Plan::kNone;  // settling both ends will do
    } else if (!StayValid(rename, there->is_dir, tree, scope)) {
        rename.plan = Rename::Plan::kReplace;
    }
}

}  // namespace

void PlanRenames(std::vector<Rename>& renames,
                 const std::function<bool(const std::string& path)>& has_documents) {
    RemoveRepeats(renames);
    const std::vector<End> ends = SortedEnds(renames);
    // The paths above the present one that are ends too, each with its first end.
    std::vector<std::vector<End>::const_iterator> above;
    for (auto begin = ends.begin(); begin != ends.end();) {
        const auto end = std::find_if(begin, ends.end(),
                                      [&](const End& other) { return other.key != begin->key; });
        while (!above.empty() && !begin->key.starts_with(above.back()->key)) {
            above.pop_back();
        }
        PlanCommonEnds(renames, begin, end, has_documents);
        if (!above.empty()) {
            for (auto it = begin; it != end; ++it) {
                renames[it->rename].plan = Rename::Plan::kReplace;
            }
        }
        above.push_back(begin);
        begin = end;
    }
    for (Rename& rename : renames) {
        if (rename.from == rename.to) {
            rename.plan = Rename::Plan::kNone;
        }
    }
}

std::vector<bool> CarryOutRenames(std::vector<Rename>& renames, Batch& batch, Index& index,
                                  const ShareTree& tree, const Scope& scope) {
    for (Rename& rename : renames) {
        CheckPlan(rename, batch, tree, scope);
    }
    // In queue order: what has been dropped when this is repeated leaves the plan as it was.
    for (const Rename& rename : renames) {
        if (rename.plan == Rename::Plan::kReplace) {
            batch.Drop(rename.from);
        }
    }
    std::vector<bool> moved;
    moved.reserve(renames.size());
    for (const Rename& rename : renames) {
        moved.push_back(
            rename.plan == Rename::Plan::kMove &&
            (batch.Rename(rename.to, rename.from) || RenameBelow(rename, batch, index)));
    }
    for (const Rename& rename : renames) {
        if (rename.plan == Rename::Plan::kReplace) {
            batch.Drop(rename.to);
        }
    }
    return moved;
}

}  // namespace fileindexd
