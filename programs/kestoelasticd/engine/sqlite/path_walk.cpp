#include "programs/kestoelasticd/engine/sqlite/path_walk.h"

#include <utility>

namespace elasticd::engine::sqlite {
namespace {

/// Rows read at a time: no statement stays open while the walk is in a deeper directory.
constexpr std::size_t kBatch = 256;

}  // namespace

void PathWalk::Run(std::int64_t top, std::string prefix, std::string_view after) {
    path_ = std::move(prefix);
    if (!after.empty() && after.starts_with(path_)) {
        Directory(top, after.substr(path_.size()));
    } else if (after < path_ || after.empty()) {
        Directory(top, std::nullopt);
    }
}

/// Children of `parent` with all that is below them, as far as they come behind `after`.
bool PathWalk::Directory(std::int64_t parent, std::optional<std::string_view> after) {
    std::vector<Waiting> waiting;
    std::string from(after.value_or(""));
    bool skip_from = after.has_value();  // the name itself has been; it may be the empty one
    if (after) {
        WaitForBegun(parent, *after, waiting);
    }
    for (bool more = true; more;) {
        std::vector<std::pair<std::string, Node>> batch;
        more = false;
        tree_.ForEachChild(parent, from, [&](std::string_view name, const Node& node) {
            if (skip_from && name == from) {
                return true;
            }
            batch.emplace_back(name, node);
            more = batch.size() == kBatch;
            return !more;
        });
        for (auto& [name, node] : batch) {
            if (!TakeWaiting(waiting, name) ||
                (node.has_document && !take_(path_ + name, node.id))) {
                return false;
            }
            if (node.has_children) {
                waiting.push_back({node.id, name, std::nullopt});
            }
        }
        if (more) {
            from = batch.back().first;
            skip_from = true;
        }
    }
    return TakeWaiting(waiting, {});
}

/// Goes into the directories that come before `next_name`; into all when there is none.
bool PathWalk::TakeWaiting(std::vector<Waiting>& waiting, std::string_view next_name) {
    while (!waiting.empty() && (next_name.data() == nullptr ||
                                std::string_view(waiting.back().name + "/") < next_name)) {
        const Waiting directory = std::move(waiting.back());
        waiting.pop_back();
        const std::size_t size = path_.size();
        path_.append(directory.name).append("/");
        const bool go_on = Directory(directory.id, directory.after);
        path_.resize(size);
        if (!go_on) {
            return false;
        }
    }
    return true;
}

/// Directories whose own names come before `after` and whose children do not, or not all.
void PathWalk::WaitForBegun(std::int64_t parent, std::string_view after,
                            std::vector<Waiting>& waiting) {
    const std::size_t slash = after.find('/');
    const std::string_view first = after.substr(0, slash);
    for (std::size_t size = 0; size <= first.size(); ++size) {
        if (size < first.size() && static_cast<unsigned char>(first[size]) >= '/') {
            continue;  // all below that one has been
        }
        const std::string_view name = first.substr(0, size);
        const std::optional<Node> node = tree_.FindChild(parent, name);
        if (node && node->has_children) {
            const bool itself = size == first.size() && slash != std::string_view::npos;
            std::optional<std::string> rest;
            if (itself) {
                rest = after.substr(slash + 1);
            }
            waiting.push_back({node->id, std::string(name), std::move(rest)});
        }
    }
}

}  // namespace elasticd::engine::sqlite
