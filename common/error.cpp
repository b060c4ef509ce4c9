#include "common/error.h"

namespace quivra {
namespace {

std::string ComposeMessage(int code, const std::string& reason) {
    // Not by a stream: the host program's locale may group digits.
    std::string message = "Quivra error, code=" + std::to_string(code);
    if (!reason.empty()) {
        message += ", reason=[" + reason + "]";
    }
    return message;
}

}  // namespace

Error::Error(ErrorCode error_code, const std::string& error_reason)
    : std::runtime_error(ComposeMessage(error_code, error_reason)),
      code(error_code),
      reason(error_reason) {}

Error::Error(int error_code, const std::string& error_reason)
    : Error(static_cast<ErrorCode>(error_code), error_reason) {}

}  // namespace quivra
