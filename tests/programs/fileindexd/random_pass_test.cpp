#include <dlfcn.h>
#include <sqlite3.h>

#include <random>

#include "tests/programs/fileindexd/pass_fixture.h"

namespace {
/// The next statement number that (from 1) is not carried out, because the worker is killed;
/// 0: none.
int kill_statement_in = 0;
}  // namespace

// In the place of the library's. Everything between two statements leaves the same behind.
extern "C" int sqlite3_step(sqlite3_stmt* statement) {
    if (kill_statement_in > 0 && --kill_statement_in == 0) {
        throw fileindexd::Killed();
    }
    static const auto real =
        reinterpret_cast<decltype(&sqlite3_step)>(dlsym(RTLD_NEXT, "sqlite3_step"));
    return real(statement);
}

// The exception passes through sqlite3_exec, which then frees its statement as little as a killed
// process would.
extern "C" const char* __lsan_default_suppressions() {  // NOLINT(bugprone-reserved-identifier)
    return "leak:libsqlite3";
}

namespace fileindexd {
namespace {

/// Random changes with their events. Few names, so that they collide.
class RandomPassTest : public PassTest {
  protected:
    void StartAgain(unsigned int seed) {
        random_.seed(seed);
        PassTest::StartAgain();
        scope_.excluded = {Full("/c/a")};
        scope_.without_meta = {Full("/b")};
        IndexAll();
    }

    void Change(int count) {
        for (int i = 0; i < count; ++i) {
            ChangeOnce(RandomPath());
        }
    }

  private:
    void ChangeOnce(const std::string& path) {
        const bool exists = fs::exists(Full(path));
        const bool has_parent = HasParent(path);
        switch (random_() % 10) {
            case 0:
                return Remove(path);
            case 1:
                return has_parent && !exists ? Mkdir(path) : void();
            case 2:
                return Queue(random_() % 4 == 0 ? EVENT_REINDEX : EVENT_ATTR, path);
            case 3:
            case 4:
            case 5:
                return has_parent && !fs::is_directory(Full(path)) ? Write(path, Text()) : void();
            default:
                const std::string to = RandomPath();
                if (exists && HasParent(to)) {
                    Move(path, to);
                }
        }
    }
    std::string Text() { return std::to_string(10000 + ++number_); }
    std::string RandomPath() {
        std::string path;
        for (auto depth = 1 + random_() % 3; depth > 0; --depth) {
            path += std::string("/") + "abc"[random_() % 3];
        }
        return path;
    }
    bool HasParent(const std::string& path) const {
        return fs::is_directory(Full(path.substr(0, path.rfind('/'))));
    }

    std::mt19937 random_;
    int number_ = 0;
};

TEST_F(RandomPassTest, TheIndexEqualsTheDiskAfterEveryPass) {
    for (unsigned int seed = 0; seed < 150; ++seed) {
        SCOPED_TRACE(seed);
        StartAgain(seed);
        for (int pass = 0; pass < 8; ++pass) {
            Change(12);
            if (pass == 4) {
                scope_.excluded = {Full("/a/b")};
                Queue(EVENT_UPDATE_CFG, "");
            }
            Run();
            ASSERT_EQ(index_->Committed(), Expected());
        }
    }
}

class KilledPassTest : public RandomPassTest {
  protected:
    /// Runs with one kill in it, at a call of the index or at a statement of the backlog. False
    /// when there are not so many.
    bool RunAndKill(bool at_statement, int count) {
        (at_statement ? kill_statement_in : kill_call_in_) = count;
        index_->KillAt(kill_call_in_);
        bool killed = false;
        try {
            Run();
        } catch (const Killed&) {
            killed = true;
        }
        kill_statement_in = kill_call_in_ = 0;
        index_->KillAt(0);
        return killed;
    }

  private:
    int kill_call_in_ = 0;
};

TEST_F(KilledPassTest, WorkThatWasKilledAnywhereEndsTheSame) {
    for (unsigned int seed = 0; seed < 20; ++seed) {
        const bool at_statement = seed % 2 == 0;
        bool killed = true;
        for (int kill = 1; killed; kill += at_statement ? 3 : 1) {
            SCOPED_TRACE("seed " + std::to_string(seed) + ", killed at " + std::to_string(kill));
            StartAgain(seed);
            Change(15);
            RunPass();  // what it leaves is waiting when the next changes come
            Change(15);
            killed = RunAndKill(at_statement, kill);
            if (kill % 2 == 0) {
                index_->LoseBatch();
            }
            Change(4);
            Open(root_);
            Run();
            Run();
            ASSERT_EQ(index_->Committed(), Expected());
        }
    }
}

}  // namespace
}  // namespace fileindexd
