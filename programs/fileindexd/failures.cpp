#include "programs/fileindexd/failures.h"

#include <algorithm>

namespace fileindexd {

namespace {

constexpr std::size_t kFindChunk = 500;

}  // namespace

std::vector<Problem> ReadProblems(Index& index, const std::vector<std::string>& extracted) {
    std::vector<Problem> problems;
    for (std::size_t begin = 0; begin < extracted.size(); begin += kFindChunk) {
        const auto first = extracted.begin() + static_cast<std::ptrdiff_t>(begin);
        const auto count = std::min(kFindChunk, extracted.size() - begin);
        const std::vector<std::string> paths(first, first + static_cast<std::ptrdiff_t>(count));
        for (const Document& document : index.Find(paths)) {
            if (!document.content_error.empty()) {
                problems.push_back(
                    {document.path, document.content_error, document.error_can_pass});
            }
        }
    }
    return problems;
}

}  // namespace fileindexd
