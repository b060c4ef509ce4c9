#include "tests/programs/fileindexd/fake_index.h"

#include <sys/stat.h>

#include <fstream>
#include <sstream>

#include "base/path.h"

namespace fileindexd {

FakeIndex::Content Extract(const std::string& path, bool need_meta) {
    struct stat info {};
    if (lstat(path.c_str(), &info) != 0) {
        throw DocumentError("Parse failed, path=" + path, true);
    }
    const auto nanoseconds = [](const timespec& time) {
        return time.tv_sec * std::int64_t{1'000'000'000} + time.tv_nsec;
    };
    FakeIndex::Content content;
    content.attributes = {S_ISDIR(info.st_mode), info.st_size, nanoseconds(info.st_mtim),
                          nanoseconds(info.st_ctim), info.st_ino};
    if (need_meta && !content.attributes.is_dir) {
        std::ostringstream text;
        text << std::ifstream(path).rdbuf();
        content.text = text.str();
    }
    return content;
}

void FakeIndex::Call() {
    if (kill_in_ > 0 && --kill_in_ == 0) {
        throw Killed();
    }
}

void FakeIndex::Upsert(const std::string& path, bool need_meta) {
    const std::lock_guard lock(mutex_);
    Call();
    Content content = Extract(path, need_meta);
    if (const auto bad = unreadable.find(path); need_meta && bad != unreadable.end()) {
        content.text.clear();
        content.error = "it cannot be read";
        content.error_can_pass = bad->second;
    }
    extracted += need_meta && !content.attributes.is_dir;
    pending_[path] = content;
}

bool FakeIndex::SetAttributes(const std::string& path) {
    Call();
    const auto found = pending_.find(path);
    if (found == pending_.end()) {
        return false;
    }
    found->second.attributes = Extract(path, false).attributes;
    return true;
}

bool FakeIndex::Rename(const std::string& to, const std::string& from) {
    Call();
    if (!pending_.contains(from)) {
        return false;
    }
    const auto move = [this](const std::string& target, const std::string& source) {
        if (auto node = pending_.extract(source)) {
            pending_[target] = node.mapped();
        }
    };
    move(to, from);
    Call();  // the command is several requests
    for (const auto& [path, content] : committed_) {
        if (quivra::base::IsBelow(path, from)) {
            move(quivra::base::Moved(path, from, to), path);
        }
    }
    return true;
}

void FakeIndex::Delete(const std::string& path) {
    Call();
    pending_.erase(path);
}

void FakeIndex::DeleteBelow(const std::string& directory) {
    Call();
    std::erase_if(pending_,
                  [&](const auto& entry) { return quivra::base::IsBelow(entry.first, directory); });
}

void FakeIndex::Commit() {
    Call();
    committed_ = pending_;
    Call();  // killed before the answer came
}

namespace {

Document MakeDocument(const std::string& path, const FakeIndex::Content& content) {
    return {path, content.attributes, content.error, content.error_can_pass};
}

}  // namespace

std::vector<Document> FakeIndex::ListBelow(const std::string& directory, const std::string& after,
                                           std::size_t limit) {
    Call();
    std::vector<Document> page;
    for (const auto& [path, content] : committed_) {
        if (quivra::base::IsBelow(path, directory) && path > after && page.size() < limit) {
            page.push_back(MakeDocument(path, content));
        }
    }
    return page;
}

std::vector<Document> FakeIndex::Find(const std::vector<std::string>& paths) {
    Call();
    std::vector<Document> found;
    for (const std::string& path : paths) {
        if (const auto it = committed_.find(path); it != committed_.end()) {
            found.push_back(MakeDocument(path, it->second));
        }
    }
    return found;
}

}  // namespace fileindexd
