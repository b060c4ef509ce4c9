#include "programs/kestoelasticd/engine_error.h"

#include <xapian.h>

#include <cerrno>
#include <cstring>
#include <exception>
#include <new>
#include <string>

#include "common/error.h"
#include "common/log.h"
#include "programs/kestoelasticd/codes.h"

namespace elasticd {
namespace {

int CodeOf(const Xapian::Error& error) {
    const char* system_error = error.get_error_string();
    if (system_error != nullptr && (std::strcmp(system_error, std::strerror(ENOSPC)) == 0 ||
                                    std::strcmp(system_error, std::strerror(EDQUOT)) == 0)) {
        return kNoSpace;
    }
    const std::string type = error.get_type();
    return type == "DatabaseOpeningError" || type == "DatabaseNotFoundError" ||
                   type == "DatabaseLockError" || type == "DatabaseVersionError"
               ? kIndexUnavailable
               : kEngineFailed;
}

}  // namespace

bool IsEngineError(int code) {
    return code == kNoSpace || code == kIndexUnavailable || code == kEngineFailed ||
           code == kOutOfMemory;
}

void RethrowTranslated() {
    try {
        throw;
    } catch (const quivra::Error&) {
        throw;
    } catch (const Xapian::Error& error) {
        const std::string text = "Search engine: " + error.get_description();
        quivra::LogTrace({"engine", __LINE__}, "%s", text.c_str());
        throw quivra::Error(CodeOf(error), text);
    } catch (const std::bad_alloc&) {
        throw quivra::Error(kOutOfMemory, "Out of memory");
    } catch (const std::exception& error) {
        throw quivra::Error(kEngineFailed, error.what());
    }
}

}  // namespace elasticd
