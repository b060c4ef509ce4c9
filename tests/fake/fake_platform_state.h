#pragma once

#include <kesto/share.h>

#include <mutex>
#include <optional>
#include <set>

#include "tests/fake/fake_platform.h"

/// What the fake's two halves share: the verbs that tests use, and the calls that the code under
/// test makes.
namespace fake {

struct Share {
    std::string path;
    unsigned int ftp_privilege = 0;
    std::map<ShareFlag, int> flags;
    std::map<std::string, int> privileges;
};

struct Failure {
    int times;
    int code;
};

using Ids = std::pair<unsigned int, unsigned int>;

struct State {
    std::map<std::string, Share> shares;
    std::map<std::string, Ids> users{{"root", {0, 0}}};
    std::set<std::string> administrators{"root"};
    std::optional<Ids> effective_ids;
    std::set<int> home_kinds;
    std::vector<std::string> home_recycle_paths;
    std::map<std::string, int> fs_types;
    std::set<std::string> mount_points;
    std::set<std::string> snapshot_paths;
    std::map<std::string, int> acls;
    std::map<std::string, int> recycle_answers;
    bool space_enough = true;
    int space_code = 0;
    bool spotlight = false;
    std::function<int(const std::vector<std::string>&)> on_exec;
    std::map<std::string, Json::Value> documents;
    std::map<std::pair<std::string, std::string>, Json::Value> monitor_queues;
    std::map<std::string, Failure> failures;
    std::function<void(const std::string&)> on_call;
    std::vector<std::string> calls;
};

/// The state, locked for as long as the object lives.
class Locked {
  public:
    State* operator->();
    State& operator*();

  private:
    std::lock_guard<std::mutex> lock_{Mutex()};
    static std::mutex& Mutex();
};

/// What KLIBCErrGet answers to this thread. SetCode answers -1.
int LastCode();
int SetCode(int code);

/// Whether the call of that name is to fail; its code is set then.
bool MustFail(const std::string& name);

/// Records a call. True when it is to fail.
bool Record(const std::string& name, const std::string& arguments);

inline std::string Text(const std::string& text) {
    return text;
}
inline std::string Text(const KESTOShare* share) {
    return share->szName;
}
inline std::string Text(unsigned long long number) {
    return std::to_string(number);
}
inline std::string Text(int number) {
    return std::to_string(number);
}

template <typename... Arguments>
bool Begin(const std::string& name, const Arguments&... arguments) {
    std::string text;
    ((text += (text.empty() ? "" : ", ") + Text(arguments)), ...);
    return Record(name, text);
}

}  // namespace fake
