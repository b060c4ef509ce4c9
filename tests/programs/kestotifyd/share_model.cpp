#include "tests/programs/kestotifyd/share_model.h"

#include <gtest/gtest.h>

#include <filesystem>
#include <fstream>
#include <iterator>
#include <utility>

#include "base/path.h"
#include "common/lock_file.h"
#include "fileindex/event.h"
#include "tests/support/program.h"

namespace fs = std::filesystem;
using quivra::base::IsAtOrBelow;

ShareModel::ShareModel(std::string folder, std::string queue)
    : folder_(std::move(folder)), queue_(std::move(queue)) {}

void ShareModel::Pass() {
    if (!fs::exists(queue_)) {
        return;
    }
    {
        const quivra::LockFile lock(queue_, true);
        fs::rename(queue_, queue_ + ".tmp");
    }
    std::ifstream lines(queue_ + ".tmp", std::ios::binary);
    for (std::string line; std::getline(lines, line);) {
        consumed_ += line + "\n";
        Carry(line);
    }
    consumed_ += "(end of a pass)\n";
    for (const auto& [path, unused] : std::exchange(marked_, {})) {
        DropBelow(entries_, path);
        Walk(path, entries_);
        if (!entries_.contains(path)) {
            missed_[path];
        }
    }
}

void ShareModel::Carry(const std::string& line) {
    using namespace quivra::fileindex;
    const Event event(line);
    switch (event.event) {
        case EVENT_DELETE:
            DropBelow(entries_, event.path);
            DropBelow(marked_, event.path);
            break;
        case EVENT_RENAME: {
            DropBelow(entries_, event.path);
            DropBelow(marked_, event.path);
            MoveBelow(marked_, event.path_old, event.path);
            const bool is_known = MoveBelow(entries_, event.path_old, event.path);
            if (!is_known || missed_.contains(event.path_old) ||
                quivra::base::Subtree(missed_, event.path_old).first !=
                    quivra::base::Subtree(missed_, event.path_old).second) {
                Mark(event.path);
            }
            break;
        }
        case EVENT_QUEUE_CRASH:
            ++crashes_;
            Mark(folder_);
            break;
        default:
            Mark(event.path);
            break;
    }
}

void ShareModel::DropBelow(Entries& entries, const std::string& path) {
    entries.erase(path);
    // "0" is the character behind "/".
    entries.erase(entries.lower_bound(path + "/"), entries.lower_bound(path + "0"));
}

bool ShareModel::MoveBelow(Entries& entries, const std::string& from, const std::string& to) {
    Entries moved;
    for (const auto& [path, content] : entries) {
        if (IsAtOrBelow(path, from)) {
            moved[to + path.substr(from.size())] = content;
        }
    }
    const bool has_from = entries.contains(from);
    DropBelow(entries, from);
    entries.merge(moved);
    return has_from;
}

void ShareModel::Walk(const std::string& path, Entries& found) const {
    const fs::file_status status = fs::symlink_status(path);
    if (!fs::exists(status) || path.find("@eaDir") != std::string::npos) {
        return;
    }
    if (!fs::is_directory(status)) {
        std::ifstream file(path, std::ios::binary);
        found[path] = std::string(std::istreambuf_iterator<char>(file), {});
        return;
    }
    found[path] = "(directory)";
    std::error_code error;
    for (const fs::directory_entry& entry : fs::directory_iterator(path, error)) {
        Walk(entry.path(), found);
    }
}

ShareModel::Entries ShareModel::OnDisk() const {
    Entries found;
    Walk(folder_, found);
    return found;
}

bool ShareModel::Converges() {
    const bool is_equal = support::Eventually(
        [&] {
            Pass();
            return entries_ == OnDisk();
        },
        std::chrono::seconds(15));
    if (is_equal) {
        consumed_.clear();
        missed_.clear();
    } else {
        PrintDifference();
    }
    return is_equal;
}

void ShareModel::PrintDifference() const {
    std::string text;
    const auto list = [&text](const Entries& some, const Entries& others, const char* what) {
        for (const auto& [path, content] : some) {
            const auto other = others.find(path);
            if (other == others.end() || other->second != content) {
                text += what + path + "\n";
            }
        }
    };
    list(OnDisk(), entries_, "on the disk: ");
    list(entries_, OnDisk(), "in the index: ");
    ADD_FAILURE() << text << consumed_;
}
