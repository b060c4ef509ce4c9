#pragma once

#include <map>
#include <string>
#include <string_view>

#include "common/export.h"

namespace quivra::fileindex {

/// The class of a file, told by its extension. The values are part of the interface.
enum class FileType : int {
    kDocument = 0,  ///< text, source code, office, archive, e-book, and files without extension
    kAudio = 1,
    kVideo = 2,
    kImage = 3,
    kOther = 4,  ///< every extension that is not in the table
};

/// The class of each known extension (lower case, without the dot). Lives as long as the library
/// is loaded.
QUIVRA_EXPORT const std::map<std::string_view, FileType>& GetFileTypes();

/// The search-engine query that finds the files of a category ("document", "audio", "video",
/// "image") by extension; empty for any other category. It does not list the same extensions as
/// GetFileTypes.
QUIVRA_EXPORT std::string GetCategoryQuery(const std::string& category);

}  // namespace quivra::fileindex
