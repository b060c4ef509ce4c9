#pragma once

#include <json/json.h>
#include <kesto/share.h>

#include <functional>
#include <map>
#include <mutex>
#include <optional>
#include <set>
#include <string>
#include <utility>
#include <vector>

/// Takes the place of those functions of the platform that look at the machine, in the test program
/// and in the libraries that it loads, and of the effective ids. Linking the library
/// `fake_platform` is all it takes. Safe to use while other threads call the platform.
namespace fake {

/// What tests arrange and look at. At first: no shares, the user "root" (an administrator), all
/// paths on local file systems, space enough, everything accepted.
struct Machine {
    std::map<std::string, KESTOShare> shares;
    std::map<std::string, std::pair<unsigned int, unsigned int>> users{{"root", {0, 0}}};
    std::set<std::string> administrators{"root"};
    /// What geteuid and getegid answer; the real ids while unset. A successful
    /// ResetCredentialsByName sets them; no real id ever changes.
    std::optional<std::pair<unsigned int, unsigned int>> effective_ids;
    std::set<int> home_kinds;
    std::set<std::string> home_recycle_paths;
    std::map<std::string, int> fs_types;  ///< for the path and all below it
    std::set<std::string> mount_points;
    /// The code of KESTOQuotaIsEnough's "no"; without one there is space enough.
    std::optional<int> space_code;
    bool spotlight = false;
    /// What ParseFile finds; it fails for every other path.
    std::map<std::string, Json::Value> documents;
    /// {queue path, application} to the description's "config".
    std::map<std::pair<std::string, std::string>, Json::Value> monitor_queues;
    /// Called, outside the lock, at the start of each call with its record.
    std::function<void(const std::string& call)> on_call;

    std::vector<std::string> calls;
    std::map<std::string, int> failures;
};

/// The machine, locked for as long as the object lives.
class Platform {
  public:
    Machine* operator->();

  private:
    static std::recursive_mutex& Mutex();
    std::lock_guard<std::recursive_mutex> lock_{Mutex()};
};

void ResetPlatform();

/// The next call of that function fails with `code`, before it has any effect, in its own way:
/// negative, false or "not enough".
void FailNext(const std::string& call, int code = 0x1000);

/// The calls since the last reset whose record, "NAME(ARGUMENT, ...)", starts with `prefix`. A
/// share shows as its name, texts without quotes.
std::vector<std::string> CallsOf(const std::string& prefix);

/// Adds a share or replaces the one of that name. Its queue and index are composed as
/// PATH/@eaDir/fileindex/{queue,db}; that directory is made where PATH exists.
void AddShare(const std::string& name, const std::string& path);

}  // namespace fake
