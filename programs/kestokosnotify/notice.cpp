#include "programs/kestokosnotify/notice.h"

#include <kesto/user.h>
#include <syslog.h>

#include "programs/kestokosnotify/message.h"
#include "programs/kestokosnotify/terminals.h"

namespace notify {
namespace {

constexpr const char* kAdministrators = "@administrators";

bool IsRecipient(const Notice& notice, const std::string& user) {
    return notice.recipient == kAdministrators ? KLIBGroupIsAdminGroupMem(user.c_str(), 0) == 1
                                               : user == notice.recipient;
}

}  // namespace

int Send(const Notice& notice) {
    const std::string text = OneLine(ResolveMessage(notice.title) + ": " +
                                     ResolveMessage(notice.message, notice.arguments));
    // The log keeps the tags: a reader of it may want the link.
    syslog(LOG_WARNING, "%s to %s: %s", OneLine(notice.application).c_str(),
           OneLine(notice.recipient).c_str(), text.c_str());
    const std::string shown = "\r\n\a" + WithoutTags(text) + "\r\n";
    return WriteToTerminals(shown,
                            [&](const std::string& user) { return IsRecipient(notice, user); });
}

}  // namespace notify
