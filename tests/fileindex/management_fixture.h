#pragma once

#include <functional>
#include <mutex>
#include <string>
#include <vector>

#include "fileindex/folder_mgr.h"
#include "fileindex/status_mgr.h"
#include "tests/fake/scripted_server.h"
#include "tests/fileindex/library_fixture.h"

namespace quivra::fileindex {

/// Both daemons and the platform, with one record of what the library asked of them, in order. Any
/// single outside call can be made to fail.
class ManagementTest : public LibraryTest {
  protected:
    static constexpr int kNever = -1;

    ManagementTest();
    ~ManagementTest() override;

    /// Back to a machine with nothing configured, all steps forgotten.
    void Reset();

    /// The steps with an effect: "search COMMAND ID", "daemon COMMAND SHARE", "save" (a
    /// configuration file), and the platform's MonitorQueue, service and program calls.
    std::vector<std::string> Steps() const;
    /// Forgets the steps, and lets the call of that number from here on (1 is the first) fail.
    void StartSteps(int failing_call = kNever);
    /// All outside calls since StartSteps, those without an effect included.
    int OutsideCalls() const;

    /// Whether the folder lock is free and no descriptor was left open.
    void ExpectNothingHeld();

    /// Folders with all content switched on, as they are stored.
    static Json::Value List(const std::vector<std::string>& paths);
    static Json::Value Folders() { return Parse(ReadFile(kFileIndexFoldersCfgPath)); }
    static Json::Value Status() { return Parse(ReadFile(kFileIndexStatusCfgPath)); }
    static std::string QueuePath(const std::string& root) {
        return root + "/@eaDir/fileindex/queue";
    }
    /// The lines of a queue file.
    static std::vector<Json::Value> Queue(const std::string& root);

    fake::ScriptedServer search_{kSearchSocket};
    fake::ScriptedServer daemon_{kDaemonSocket};

  private:
    /// Counts an outside call; true when it is the one that is to fail.
    bool Count(const std::string& step);
    void OnPlatformCall(const std::string& call);

    mutable std::mutex mutex_;
    std::vector<std::string> steps_;
    int calls_ = 0;
    int failing_call_ = kNever;
    std::size_t descriptors_ = 0;
};

}  // namespace quivra::fileindex
