#pragma once

#include <json/json.h>

#include <functional>
#include <map>
#include <string>
#include <utility>
#include <vector>

/// Takes the place of the platform (all of <kesto/...> save the daemon sockets, which stay real) in
/// the test program and in the libraries that it loads, and of the effective ids. Linking the
/// library `fake_platform` is all it takes. Safe to use while other threads call the platform.
namespace fake {

/// The file-system types that the fake knows.
enum FSType { kFSLocal = 1, kFSVirtual = 12, kFSRemote = 64, kFSImage = 128 };

/// What KLIBCErrorGetFile and KLIBCErrorGetLine answer after a failure.
inline constexpr const char* kErrorFile = "platform.c";
inline constexpr int kErrorLine = 42;
/// The code of a failure that no FailNext asked for: unknown share, user or list entry.
inline constexpr int kErrorNotFound = 0x1400;

/// Back to the initial state: no shares, the user "root" (an administrator), everything local,
/// space enough, all rights granted, services accepted, programs answering 0, no calls recorded.
void ResetPlatform();

/// The next `times` calls of that function fail with `code`, before they have any effect; -1 times
/// means all. A function whose failure is not negative fails in its own way: false, a null list,
/// "not enough".
void FailNext(const std::string& call, int times = 1, int code = 0x1000);

/// Called, outside the fake's own lock, at the start of each platform call with its record.
void OnCall(std::function<void(const std::string& call)> action);

/// The calls since the last reset or ClearCalls, oldest first, as "NAME(ARGUMENT, ...)"; a share
/// record shows as the share's name, texts without quotes. KLIBCErr* and the pure list calls are
/// not recorded.
std::vector<std::string> Calls();
/// Those whose record starts with `prefix`: "KESTOShareGet(" or "KLIBService".
std::vector<std::string> CallsOf(const std::string& prefix);
void ClearCalls();

/// Shares. AddShare replaces one of the same name; a share's queue and index are composed as
/// PATH/@eaDir/fileindex/{queue,db}, and that directory is made where PATH exists.
enum class ShareFlag { kReadOnly, kHideUnreadable, kEncryption, kEncrypted, kRecycle };
void AddShare(const std::string& name, const std::string& path);
void RemoveShare(const std::string& name);
void SetFlag(const std::string& share, ShareFlag flag, int value = 1);
void SetFTPPrivilege(const std::string& share, unsigned int value);
void SetUserPrivilege(const std::string& share, const std::string& user, int privilege);

/// Users, and the effective ids that geteuid and getegid answer (at first the real ones). A
/// successful ResetCredentialsByName of a known user changes them; no real id ever changes.
void AddUser(const std::string& name, unsigned int uid, unsigned int gid);
void AddAdministrator(const std::string& name);
void SetEffectiveIds(unsigned int uid, unsigned int gid);
void EnableHomes(int kind, bool enabled = true);
void AddHomeRecyclePath(const std::string& path);

/// File systems. A type counts for the path and all below it. SetSpace with false makes
/// KESTOQuotaIsEnough answer 0 and KLIBCErrGet `code`.
void SetFSType(const std::string& path, int type);
void SetMountPoint(const std::string& path, bool mounted = true);
void SetInSnapshot(const std::string& path);
void SetACL(const std::string& path, int mask);
void SetSpace(bool enough, int code = 0x2400);
/// Makes KESTOShareIsShareRecycle answer for that path. A path that is, or lies below, "#recycle"
/// in the root of a share needs no entry.
void SetRecycle(const std::string& path, int answer);

/// Services: the search integration's state (off at first). Service calls are only recorded.
void SetSpotlight(bool enabled);
bool IsSpotlightEnabled();

/// Programs: `action` gets the program and its arguments and gives the exit status. Without one
/// every program answers 0 and nothing runs.
void OnExec(std::function<int(const std::vector<std::string>& command)> action);

/// What ParseFile fills in for that path. Without an entry it fills the members that come from the
/// path alone (path, parent, the names, extension and kind), and with need_meta a
/// "KESTOMDTextContent" of "content of PATH".
void SetDocument(const std::string& path, const Json::Value& data);

/// The monitor registrations: {queue path, application} to the description's "config".
std::map<std::pair<std::string, std::string>, Json::Value> MonitorQueues();

}  // namespace fake
