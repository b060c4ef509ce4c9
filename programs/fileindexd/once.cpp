#include "programs/fileindexd/once.h"

#include <chrono>
#include <exception>
#include <iomanip>
#include <iostream>

#include "common/error.h"
#include "fileindex/elastic/elastic_control.h"
#include "programs/fileindexd/share_worker.h"

namespace fileindexd {

namespace {

using Seconds = std::chrono::duration<double>;

void Print(const std::string& share, int consumed, const Counts& counts, Seconds took) {
    std::cout << share << ": " << counts.indexed << " indexed, " << counts.refreshed
              << " refreshed, " << counts.renamed << " renamed, " << counts.removed << " removed, "
              << counts.skipped << " skipped; consumed: " << consumed << "; " << std::fixed
              << std::setprecision(2) << took.count() << " s" << std::endl;
}

void ProcessShare(const std::string& share) {
    const auto begin = std::chrono::steady_clock::now();
    int consumed = 0;
    Counts counts;
    ShareWorker worker(share);
    quivra::fileindex::elastic::ShareIndexCreate(share);
    worker.CheckIndex();
    for (;;) {
        const PassResult result = worker.RunPass();
        if (!result.had_work) {
            break;
        }
        consumed += result.consumed;
        counts += result.counts;
    }
    for (auto next = worker.NextSlice(); next && next->count() == 0; next = worker.NextSlice()) {
        counts += worker.RunSlice().counts;
    }
    worker.State().Remove();
    Print(share, consumed, counts, std::chrono::steady_clock::now() - begin);
}

}  // namespace

int RunOnce(const std::vector<std::string>& shares) {
    int status = 0;
    MakeRunDirectory();
    for (const std::string& share : shares) {
        try {
            ProcessShare(share);
        } catch (const std::exception& error) {
            std::cerr << "fileindexd: share " << share << ": " << error.what() << std::endl;
            status = 1;
        }
    }
    return status;
}

}  // namespace fileindexd
