#pragma once

#include <gtest/gtest.h>

#include <algorithm>
#include <ctime>
#include <filesystem>
#include <fstream>
#include <memory>
#include <set>

#include "base/path.h"
#include "common/error.h"
#include "common/json.h"
#include "fileindex/event.h"
#include "programs/fileindexd/catch_up.h"
#include "programs/fileindexd/pass.h"
#include "tests/programs/fileindexd/fake_index.h"

namespace fs = std::filesystem;

namespace fileindexd {

using quivra::Error;
using quivra::base::IsAtOrBelow;
using quivra::base::IsBelow;
using namespace quivra::fileindex;

/// The rules of a test: what lies below one of `excluded`, or not below `only`, is not indexed,
/// what lies below one of `without_meta` without content.
class TestScope : public Scope {
  public:
    bool Covers(const std::string& path, bool) const override {
        return !IsIn(path, excluded) && IsAtOrBelow(path, only);
    }
    bool NeedsMeta(const std::string& path) const override { return !IsIn(path, without_meta); }
    std::vector<std::string> RootsWithin(const std::string& path) const override {
        if (Covers(path, true)) {
            return {path};
        }
        return IsBelow(only, path) ? std::vector{only} : std::vector<std::string>{};
    }
    bool HaveSameRules(const std::string& one, const std::string& other) const override {
        return IsIn(one, excluded) == IsIn(other, excluded) &&
               IsIn(one, without_meta) == IsIn(other, without_meta);
    }
    std::string Describe(const std::string&) const override {
        return std::to_string(without_meta.size());
    }

    std::string only = "/volume1";
    std::set<std::string> excluded;
    std::set<std::string> without_meta;

  private:
    static bool IsIn(const std::string& path, const std::set<std::string>& places) {
        return std::any_of(places.begin(), places.end(),
                           [&](const std::string& place) { return IsAtOrBelow(path, place); });
    }
};

/// A share on disk, its queue and its index. Paths are given without the share's root.
class PassTest : public testing::Test {
  protected:
    PassTest() { StartAgain(); }

    void StartAgain() {
        catch_up_.reset();
        backlog_.reset();
        fs::remove_all(root_);
        fs::create_directories(root_ + "/@eaDir/fileindex");
        index_ = std::make_unique<FakeIndex>();
        Open(root_);
    }

    /// As a worker that starts.
    void Open(const std::string& root) {
        catch_up_.reset();
        backlog_.reset();
        directory_ = quivra::base::PrivateDirectory::Open(root + "/@eaDir/fileindex");
        backlog_ = std::make_unique<Backlog>(directory_);
        catch_up_ = std::make_unique<CatchUp>(*backlog_);
        if (backlog_->IsNew()) {
            backlog_->BeginEmpty(scope_.Describe(root));
        }
    }

    std::string Full(const std::string& path) const { return root_ + path; }

    void Put(const std::string& path, const std::string& text) {
        fs::create_directories(Full(path).substr(0, Full(path).rfind('/')));
        std::ofstream(Full(path), std::ios::trunc) << text;
    }

    void Queue(unsigned int event, const std::string& path, const std::string& old = "",
               bool is_dir = false, const Json::Value& data = Json::Value()) {
        Json::Value line;
        line["event"] = event;
        line["is_dir"] = is_dir;
        line["path"] = Full(path);
        line["path_old"] = old.empty() ? "" : Full(old);
        line["data"] = data;
        std::ofstream(queue_, std::ios::app) << quivra::toString(line) << "\n";
    }

    /// A change of the disk together with its event.
    void Write(const std::string& path, const std::string& text) {
        const bool existed = fs::exists(Full(path));
        Put(path, text);
        Queue(existed ? EVENT_MODIFY : EVENT_CREATE, path);
    }
    void Mkdir(const std::string& path) {
        if (fs::create_directory(Full(path))) {
            Queue(EVENT_CREATE, path, "", true);
        }
    }
    void Remove(const std::string& path) {
        const bool is_dir = fs::is_directory(Full(path));
        std::error_code ignored;  // a file may stand where the path wants a directory
        if (fs::remove_all(Full(path), ignored) + 1 > 1) {
            Queue(EVENT_DELETE, path, "", is_dir);
        }
    }
    bool Move(const std::string& from, const std::string& to) {
        const bool is_dir = fs::is_directory(Full(from));
        if (from == to || rename(Full(from).c_str(), Full(to).c_str()) != 0) {
            return false;
        }
        Queue(EVENT_RENAME, to, from, is_dir);
        return true;
    }

    PassResult RunPass(PassListener listener = {}) {
        Pass pass({directory_, directory_.Path() + "/queue", Root(), *backlog_, files_time_},
                  *index_, scope_, std::move(listener));
        PassResult result = pass.Run();
        catch_up_->Forget(result.left);
        return result;
    }
    /// As short a slice as there is.
    void RunSlice(const PassListener& listener = {}, std::int64_t now = time(nullptr),
                  CatchUp::Clock::time_point until = {}) {
        const ShareTree tree(Root());
        catch_up_->Run({*index_, tree, scope_}, listener, until, now);
    }
    void Run(const PassListener& listener = {}) {
        RunPass(listener);
        while (backlog_->NextDue() == 0) {
            RunSlice(listener, time(nullptr),
                     CatchUp::Clock::now() + std::chrono::milliseconds(500));
        }
    }
    std::string Root() const {
        return directory_.Path().substr(0, directory_.Path().find("/@eaDir"));
    }

    /// What the index should hold: the disk, walked in the simplest way.
    FakeIndex::Documents Expected() const {
        FakeIndex::Documents expected;
        const auto add = [&](const std::string& path, bool is_dir) {
            if (scope_.Covers(path, is_dir)) {
                expected[path] = Extract(path, scope_.NeedsMeta(path));
            }
        };
        add(root_, true);
        for (auto it = fs::recursive_directory_iterator(root_); it != fs::end(it); ++it) {
            if (it->path().filename() == "@eaDir") {
                it.disable_recursion_pending();
            } else if (!it->is_symlink()) {
                add(it->path(), it->is_directory());
            }
        }
        return expected;
    }

    void IndexAll() {
        Queue(EVENT_REINDEX, "");
        Run();
        index_->extracted = 0;
        ASSERT_EQ(index_->Committed(), Expected());
    }

    const std::string root_ = "/volume1/share";
    const std::string queue_ = root_ + "/@eaDir/fileindex/queue";
    std::chrono::milliseconds files_time_{300};
    quivra::base::PrivateDirectory directory_;
    std::unique_ptr<Backlog> backlog_;
    std::unique_ptr<CatchUp> catch_up_;
    std::unique_ptr<FakeIndex> index_;
    TestScope scope_;
};

}  // namespace fileindexd
