#pragma once

#include <string>
#include <vector>

#include "programs/fileindexctl/session.h"

namespace quivra::ctl {

/// Prints rows in columns as wide as their widest cell; the first row is the heading. Cells are
/// shown as Session::Shown does.
void PrintTable(Session& session, const std::vector<std::vector<std::string>>& rows);

}  // namespace quivra::ctl
