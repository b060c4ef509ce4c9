#include "tests/system/file_user.h"

#include <sys/stat.h>

#include <filesystem>
#include <fstream>
#include <iomanip>
#include <iterator>

#include "fileindex/event.h"
#include "tests/support/index_state.h"

namespace fs = std::filesystem;
using namespace quivra::fileindex;

FileUser::FileUser(unsigned int seed, std::string root, std::string outside, Observer observer)
    : random_(seed),
      root_(std::move(root)),
      outside_(std::move(outside)),
      observer_(std::move(observer)) {}

void FileUser::DoSomething() {
    static constexpr void (FileUser::*kActions[])() = {
        &FileUser::CreateFile,   &FileUser::CreateFile, &FileUser::CreateDirectory,
        &FileUser::ModifyFile,   &FileUser::ModifyFile, &FileUser::DeleteSomething,
        &FileUser::Rename,       &FileUser::Rename,     &FileUser::ReplaceByRename,
        &FileUser::ChangeRights, &FileUser::MoveOut,    &FileUser::MoveIn};
    (this->*kActions[Below(std::size(kActions))])();
}

void FileUser::Report(unsigned int event, bool is_dir, const std::string& path,
                      const std::string& path_old) const {
    if (observer_) {
        observer_(event, is_dir, path, path_old);
    }
}

std::vector<std::string> FileUser::Existing(bool directories) const {
    std::vector<std::string> found;
    for (const auto& [path, content] : support::ContentsOnDisk(root_)) {
        if ((content == "/") == directories) {
            found.push_back(path);
        }
    }
    return found;
}

std::string FileUser::Pick(const std::vector<std::string>& from) {
    return from.empty() ? std::string() : from[Below(from.size())];
}

/// Few names, so that they come back after a delete or a rename.
std::string FileUser::FreeName() {
    std::vector<std::string> parents = Existing(true);
    parents.push_back(root_);
    for (int attempt = 0; attempt < 20; ++attempt) {
        const std::string path = Pick(parents) + "/" + "abcde\xff"[Below(6)];
        if (!fs::exists(path)) {
            return path;
        }
    }
    return root_ + "/n" + std::to_string(++counter_);
}

void FileUser::Write(const std::string& path) {
    // All of one size, so that size and second often stay the same.
    std::ofstream(path) << "token" << std::setw(8) << std::setfill('0') << ++counter_ << '\n';
}

void FileUser::CreateFile() {
    const std::string path = FreeName();
    Write(path);
    Report(EVENT_CREATE, false, path);
    Report(EVENT_MODIFY, false, path);
}

void FileUser::CreateDirectory() {
    const std::string path = FreeName();
    fs::create_directory(path);
    Report(EVENT_CREATE, true, path);
}

void FileUser::ModifyFile() {
    const std::string path = SomeFile();
    if (!path.empty()) {
        Write(path);
        Report(EVENT_MODIFY, false, path);
    }
}

void FileUser::ChangeRights() {
    const std::string path = SomeFile();
    if (!path.empty()) {
        chmod(path.c_str(), Below(2) == 0 ? 0600 : 0644);
        Report(EVENT_ATTR, false, path);
    }
}

void FileUser::DeleteTree(const std::string& path) {
    if (fs::is_directory(path)) {
        const std::vector<fs::path> children(fs::directory_iterator{path}, {});
        for (const fs::path& child : children) {
            DeleteTree(child);
        }
    }
    const bool is_dir = fs::is_directory(path);
    fs::remove(path);
    Report(EVENT_DELETE, is_dir, path);
}

void FileUser::DeleteSomething() {
    const std::string path = Below(3) == 0 ? SomeDirectory() : SomeFile();
    if (!path.empty()) {
        DeleteTree(path);
    }
}

void FileUser::Rename() {
    const std::string from = Below(2) == 0 ? SomeDirectory() : SomeFile();
    const std::string to = FreeName();
    if (!from.empty() && (to + "/").compare(0, from.size() + 1, from + "/") != 0) {
        const bool is_dir = fs::is_directory(from);
        fs::rename(from, to);
        Report(EVENT_RENAME, is_dir, to, from);
    }
}

void FileUser::ReplaceByRename() {
    const std::string from = SomeFile();
    const std::string to = SomeFile();
    if (from != to) {
        fs::rename(from, to);
        Report(EVENT_RENAME, false, to, from);
    }
}

void FileUser::MoveOut() {
    const std::string from = Below(2) == 0 ? SomeDirectory() : SomeFile();
    if (!from.empty()) {
        const bool is_dir = fs::is_directory(from);
        fs::rename(from, outside_ + "/" + std::to_string(++counter_));
        Report(EVENT_DELETE, is_dir, from);
    }
}

void FileUser::MoveIn() {
    std::vector<std::string> outside;
    for (const auto& entry : fs::directory_iterator(outside_)) {
        outside.push_back(entry.path());
    }
    const std::string from = Pick(outside);
    if (!from.empty()) {
        const bool is_dir = fs::is_directory(from);
        const std::string to = FreeName();
        fs::rename(from, to);
        Report(EVENT_CREATE, is_dir, to);
    }
}
