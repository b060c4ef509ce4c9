#include "common/error.h"

#include <sstream>

namespace quivra {
namespace {

std::string ComposeMessage(int code, const std::string& reason) {
    std::ostringstream message;
    message << "Quivra error, code=" << code;
    if (!reason.empty()) {
        message << ", reason=[" << reason << "]";
    }
    return message.str();
}

}  // namespace

Error::Error(ErrorCode error_code, const std::string& error_reason)
    : std::runtime_error(ComposeMessage(error_code, error_reason)),
      code(error_code),
      reason(error_reason) {}

Error::Error(int error_code, const std::string& error_reason)
    : Error(static_cast<ErrorCode>(error_code), error_reason) {}

}  // namespace quivra
