#pragma once

#include <sstream>
#include <string>
#include <vector>

#include "programs/fileindexctl/application.h"
#include "tests/fake/scripted_server.h"
#include "tests/fileindex/library_fixture.h"

namespace quivra::ctl {

using fileindex::kDaemonSocket;
using fileindex::kSearchSocket;
using fileindex::Parse;
using fileindex::ReadFile;
using fileindex::WriteFile;

struct Result {
    int status;
    std::string out;
    std::string err;
};

class CtlTest : public fileindex::LibraryTest {
  protected:
    /// Runs a command line as from a terminal, or with the output going to a program.
    static Result OnTerminal(const std::vector<std::string>& arguments) {
        return RunWith(arguments, true);
    }
    static Result Piped(const std::vector<std::string>& arguments) {
        return RunWith(arguments, false);
    }
    static Json::Value PipedJson(const std::vector<std::string>& arguments) {
        const Result result = Piped(arguments);
        EXPECT_EQ(result.status, kSuccess) << result.err;
        return Parse(result.out);
    }

    /// Writes the folder set; each path has all content but `photo` switched on.
    static void SetFolders(const std::vector<std::string>& share_paths, bool paused = false) {
        Json::Value folders(Json::arrayValue);
        for (const std::string& path : share_paths) {
            Json::Value folder = Parse(R"({"document":true,"audio":true,"video":true,"photo":false,
                                           "volume_to_be_clean":""})");
            folder["path"] = path;
            folder["name"] = path.substr(1);
            folder["paused"] = paused;
            folders.append(folder);
        }
        WriteFile("/var/packages/Quivra/etc/fileindex.folders", toString(folders));
    }

    /// A share on /volume1 with a place for its queue.
    static void AddShare(const std::string& name) {
        std::filesystem::create_directories("/volume1/" + name + "/@eaDir/fileindex");
        LibraryTest::AddShare(name);
    }

    static std::string QueueOf(const std::string& share) {
        return "/volume1/" + share + "/@eaDir/fileindex/queue";
    }

  private:
    static Result RunWith(const std::vector<std::string>& arguments, bool terminal) {
        std::ostringstream out;
        std::ostringstream err;
        Session session{.out = out, .err = err};
        session.out_is_terminal = terminal;
        const int status = ctl::Run(arguments, session);
        return {status, out.str(), err.str()};
    }
};

}  // namespace quivra::ctl
