#pragma once

#include <string>
#include <vector>

#include "programs/fileindexd/batch.h"

namespace fileindexd {

/// Which of the files, sent with their content, lack it in the committed index, and why.
std::vector<Problem> ReadProblems(Index& index, const std::vector<std::string>& extracted);

}  // namespace fileindexd
