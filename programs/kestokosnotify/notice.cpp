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
    const std::string title = ResolveMessage(notice.title);
    const std::string message = ResolveMessage(notice.message, notice.arguments);
    syslog(LOG_WARNING, "%s to %s: %s: %s", notice.application.c_str(), notice.recipient.c_str(),
           title.c_str(), message.c_str());
    const std::string text = "\r\n\a" + PlainText(title) + ": " + PlainText(message) + "\r\n";
    return WriteToTerminals(text,
                            [&](const std::string& user) { return IsRecipient(notice, user); });
}

}  // namespace notify
