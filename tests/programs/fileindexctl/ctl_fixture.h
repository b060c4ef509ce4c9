#pragma once

#include <optional>
#include <sstream>
#include <string>
#include <utility>
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
    static Json::Value PipedJson(const std::vector<std::string>& arguments, int status = kSuccess) {
        const Result result = Piped(arguments);
        EXPECT_EQ(result.status, status) << result.err;
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

/// All daemons run and say that share "s" is as it should be.
class DaemonsTest : public CtlTest {
  protected:
    DaemonsTest() { StartDaemons(); }

    void StartDaemons() {
        for (auto& [daemon, socket] :
             {std::pair(&indexer_, kDaemonSocket), std::pair(&search_, kSearchSocket),
              std::pair(&monitor_, "/var/run/kestotifyd.sock")}) {
            if (!daemon->has_value()) {
                daemon->emplace(socket);
            }
        }
        TellThatAllIsWell();
    }

    void TellThatAllIsWell() {
        Tell(indexer_, R"({"shares":[{"share":"s","state":"idle","waiting":0,"eta":-1}]})");
        Tell(search_, R"({"indexes":[{"id":"fileindex_s","documents":7,"fresh":false}]})");
        Tell(monitor_, R"({"backend":"inotify","overflows":0,"last_event":0,"problem":"",
            "folders":[{"queue":")" +
                           QueueOf("s") + R"(","watched":9,"unwatched":0}]})");
    }

    /// What the daemon says of itself; other requests to the search daemon find `document_`.
    void Tell(std::optional<fake::ScriptedServer>& daemon, const std::string& state) {
        daemon->SetHandler([state, this](const Json::Value& request) {
            const bool asks_state = request["type"] == "state" || request["command"] == "state";
            return fake::Frame(R"({"success":true,"data":)" + (asks_state ? state : document_) +
                               R"(,"total":1})");
        });
    }

    std::string document_ = "[]";
    std::optional<fake::ScriptedServer> indexer_;
    std::optional<fake::ScriptedServer> search_;
    std::optional<fake::ScriptedServer> monitor_;
};

}  // namespace quivra::ctl
