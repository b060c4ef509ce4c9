#include "programs/fileindexctl/table.h"

#include <algorithm>
#include <ostream>

#include "programs/fileindexctl/text.h"

namespace quivra::ctl {

void PrintTable(Session& session, const std::vector<std::vector<std::string>>& rows) {
    // Widths are those of what is shown: an escape takes more cells than the byte it stands for.
    std::vector<std::size_t> widths;
    for (const std::vector<std::string>& row : rows) {
        widths.resize(std::max(widths.size(), row.size()), 0);
        for (std::size_t i = 0; i < row.size(); ++i) {
            widths[i] = std::max(widths[i], DisplayWidth(Shown(row[i])));
        }
    }
    for (const std::vector<std::string>& row : rows) {
        for (std::size_t i = 0; i < row.size(); ++i) {
            const std::string cell = Shown(row[i]);
            session.out << cell;
            if (i + 1 < row.size()) {
                session.out << std::string(widths[i] - DisplayWidth(cell) + 2, ' ');
            }
        }
        session.out << "\n";
    }
}

}  // namespace quivra::ctl
