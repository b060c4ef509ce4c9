#include <kesto/process.h>

#include "fileindex/index_mgr.h"

namespace quivra::fileindex {
namespace {

constexpr const char* kNotifyTool = "/usr/kesto/bin/kestokosnotify";
constexpr const char* kApplication = "KESTO.Quivra.Application";
constexpr const char* kRecipients = "@administrators";
constexpr const char* kTitleKey = "app:displayname";
constexpr int kExecFlags = 187;

/// The end marker of an argument list.
constexpr const char* kEnd = nullptr;

}  // namespace

int SendKOSNotify() {
    return KLIBCExecl(kNotifyTool, kExecFlags, "-c", kApplication, "-b", "true", "-e", "false",
                      kRecipients, kTitleKey, "error:index_no_space",
                      "<a data-kesto-app=\"KESTO.Quivra.Application\" "
                      "data-kesto-fn=\"preference\">",
                      "</a>", kEnd);
}

int NotifyLackOfMemory() {
    return KLIBCExecl(kNotifyTool, kExecFlags, "-c", kApplication, kRecipients, kTitleKey,
                      "error:lack_of_memory", kEnd);
}

}  // namespace quivra::fileindex
