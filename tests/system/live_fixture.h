#pragma once

#include <gtest/gtest.h>
#include <signal.h>
#include <sys/mount.h>
#include <sys/stat.h>

#include <chrono>
#include <filesystem>
#include <fstream>
#include <iostream>
#include <memory>
#include <thread>

#include "base/frame.h"
#include "common/error.h"
#include "common/json.h"
#include "common/log.h"
#include "fileindex/index_mgr.h"
#include "fileindex/status_mgr.h"
#include "tests/support/files.h"
#include "tests/support/index_state.h"
#include "tests/support/program.h"

/// The whole live stack on a real directory: search daemon, indexing daemon, file monitor, folder
/// set. After whatever happens, the index equals the disk and the folder's status says "finished".

namespace fs = std::filesystem;
using namespace quivra::fileindex;
using support::Contents;
using support::Eventually;
using support::Program;
using support::WriteFile;
using Clock = std::chrono::steady_clock;

inline const std::string kVolume = "/volume1";
inline const std::string kRoot = kVolume + "/photo";

inline double MillisecondsSince(Clock::time_point start) {
    return std::chrono::duration<double, std::milli>(Clock::now() - start).count();
}

inline void MountVolume(const std::string& path, const char* options) {
    fs::create_directories(path);
    ASSERT_EQ(mount("volume", path.c_str(), "tmpfs", 0, options), 0);
}

inline void SetShare(const std::string& path) {
    fs::create_directories("/etc/kesto");
    // Replaced, as an administrator's editor does it.
    WriteFile("/etc/kesto/shares.conf.new",
              "[" + fs::path(path).filename().string() + "]\npath = " + path + "\n");
    fs::rename("/etc/kesto/shares.conf.new", "/etc/kesto/shares.conf");
}

inline Json::Value FolderRequest(const std::string& path) {
    Json::Value folder;
    folder["path"] = path;
    folder["name"] = path;
    for (const char* content : {"document", "audio", "video", "photo"}) {
        folder[content] = true;
    }
    Json::Value list(Json::arrayValue);
    list.append(folder);
    return list;
}

/// The reply of the indexing daemon; null without one.
inline Json::Value AskIndexer(const Json::Value& request) {
    const auto socket = quivra::base::ConnectUnix("/var/run/fileindexd.sock");
    std::string text;
    Json::Value reply;
    if (!socket.IsValid() || !quivra::base::SendFrame(socket.Get(), quivra::toString(request)) ||
        !quivra::base::ReceiveFrame(socket.Get(), text) || !quivra::fromString(reply, text)) {
        return Json::nullValue;
    }
    return reply;
}

/// What the daemon says of its only share.
inline Json::Value ShareState() {
    Json::Value request;
    request["type"] = "state";
    return AskIndexer(request)["data"]["shares"][0];
}

/// What FolderList says of the first folder.
inline std::string StatusText() {
    Json::Value additional;
    additional.append("status");
    Json::Value result;
    FolderList(result, 0, 1, "path", "", additional);
    return result["folder"][0]["additional"]["status"]["text"].asString();
}

class LiveTest : public testing::Test {
  protected:
    void SetUp() override {
        log_level = 0;
        MountVolume(kVolume, "size=400m");
        fs::create_directories(kRoot);
        fs::create_directories("/var/packages/Quivra/etc");
        SetShare(kRoot);
        StartAll();
        WriteFile(kRoot + "/first.txt", "there before the folder was chosen\n");
        FolderAdd(FolderRequest("/photo"), false);
        ExpectSettled("photo", kRoot);
    }

    void TearDown() override {
        monitor_.reset();
        indexer_.reset();
        engine_.reset();
        umount2(kVolume.c_str(), MNT_DETACH);
        umount2("/volume2", MNT_DETACH);
        for (const char* path : {"/volume1", "/volume2", "/var/packages", "/var/lib/kesto",
                                 "/etc/kesto", "/tmp/outside"}) {
            fs::remove_all(path);
        }
    }

    void StartEngine() {
        engine_ = std::make_unique<Program>(
            support::StartDaemon("kestoelasticd", "/var/run/kestoelasticd.sock"));
    }
    void StartIndexer() {
        indexer_ = std::make_unique<Program>(
            support::StartDaemon("fileindexd", "/var/run/fileindexd.sock"));
    }
    void StartMonitor() {
        monitor_ = std::make_unique<Program>("kestotifyd", std::vector<std::string>());
    }
    void StartAll() {
        StartEngine();
        StartIndexer();
        StartMonitor();
    }

    /// Waits until the index holds what is on disk, and the folder's status says so.
    void ExpectSettled(const std::string& share, const std::string& root) {
        Contents disk;
        Contents index;
        const bool settled = Eventually(
            [&] {
                try {
                    disk = support::ContentsOnDisk(root);
                    index = support::ContentsInIndex(share, root);
                    return disk == index && StatusText() == "finished";
                } catch (const quivra::Error&) {
                    return false;  // a daemon is being restarted, an index is being moved
                }
            },
            std::chrono::seconds(60));
        EXPECT_TRUE(settled) << "status: " << StatusText() << "\n"
                             << support::Difference(disk, index);
    }
    void ExpectSettled() { ExpectSettled("photo", kRoot); }

    bool IsFound(const std::string& path, const std::string& content) {
        const Contents index = support::ContentsInIndex("photo", kRoot);
        const auto found = index.find(path);
        return found != index.end() && found->second == content;
    }

    /// Kills the share's worker in the middle of a pass, or of a slice, when it is caught at one.
    static void KillWorkerAtWork() {
        Eventually([] { return ShareState()["state"] == "processing"; },
                   std::chrono::milliseconds(500));
        const int pid = ShareState()["pid"].asInt();
        if (pid > 0) {
            kill(pid, SIGKILL);
        }
    }

    void MakeDirectory(const std::string& path, int files) {
        fs::create_directories(path);
        for (int i = 0; i < files; ++i) {
            WriteFile(path + "/file " + std::to_string(i) + ".txt", "number " + std::to_string(i));
        }
    }

    std::unique_ptr<Program> engine_;
    std::unique_ptr<Program> indexer_;
    std::unique_ptr<Program> monitor_;
};
