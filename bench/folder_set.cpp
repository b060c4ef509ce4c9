// The folder set and the scan for pending work. The floors are bare parses with the JSON reader,
// reused, of the same text in memory. Writes to the library's fixed paths, so run it as:
//
//   scripts/sandbox build/release/bench/folder_set [LINES]     (default 1000000)

#include <json/json.h>
#include <unistd.h>

#include <algorithm>
#include <atomic>
#include <chrono>
#include <cstdio>
#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <functional>
#include <memory>
#include <new>
#include <string>
#include <vector>

#include "common/json.h"
#include "common/log.h"
#include "fileindex/folder_mgr.h"
#include "fileindex/queue_mgr.h"

namespace {

std::atomic<std::size_t> allocations{0};

}  // namespace

// Counts every allocation of the process, the library's included.
void* operator new(std::size_t size) {
    ++allocations;
    void* memory = std::malloc(size);
    if (memory == nullptr) {
        throw std::bad_alloc();
    }
    return memory;
}
void operator delete(void* memory) noexcept {
    std::free(memory);
}
void operator delete(void* memory, std::size_t /*size*/) noexcept {
    std::free(memory);
}

namespace {

using quivra::fileindex::FolderMgr;
using quivra::fileindex::QueueMgr;

constexpr int kRepetitions = 5;
constexpr std::size_t kFolders = quivra::fileindex::kFileIndexFoldersMax;
constexpr const char* kQueuePath = "/tmp/folder_set.queue";

double Seconds(const std::function<void()>& work) {
    double best = 1e9;
    for (int i = 0; i < kRepetitions; ++i) {
        const auto start = std::chrono::steady_clock::now();
        work();
        const std::chrono::duration<double> taken = std::chrono::steady_clock::now() - start;
        best = std::min(best, taken.count());
    }
    return best;
}

double ParseSeconds(const std::vector<std::string>& texts) {
    Json::CharReaderBuilder builder;
    builder["collectComments"] = false;
    const std::unique_ptr<Json::CharReader> reader(builder.newCharReader());
    return Seconds([&] {
        for (const std::string& text : texts) {
            Json::Value value;
            if (!reader->parse(text.data(), text.data() + text.size(), &value, nullptr)) {
                std::abort();
            }
        }
    });
}

void Report(const char* name, double floor, double total, double wanted) {
    std::printf("%-32s floor %9.3f ms  total %9.3f ms  ratio %5.2f; at most %.1f wanted\n", name,
                floor * 1e3, total * 1e3, total / floor, wanted);
}

/// One share, and as many folders in it as the set may hold.
std::string Configure() {
    std::filesystem::create_directories("/volume1/photo");
    std::filesystem::create_directories("/etc/kesto");
    std::ofstream("/etc/kesto/shares.conf") << "[photo]\npath = /volume1/photo\n";
    Json::Value folders(Json::arrayValue);
    for (std::size_t i = 0; i < kFolders; ++i) {
        const std::string path = "/photo/albums/folder number " + std::to_string(i);
        folders.append(
            quivra::fileindex::Folder(path, "A folder", true, false, true, true, false).GetData());
    }
    const std::filesystem::path file = quivra::fileindex::kFileIndexFoldersCfgPath;
    std::filesystem::create_directories(file.parent_path());
    quivra::toFile(folders, file);
    return quivra::toString(folders);
}

void ReportLookup() {
    const FolderMgr folder_mgr;
    const std::string path = "/volume1/photo/albums/folder number 999/IMG_1.jpeg";
    if (folder_mgr.GetMostSuitableCfg(path) == nullptr) {  // computes the full paths
        std::abort();
    }
    constexpr std::size_t kLookups = 1000;
    const std::size_t before = allocations;
    const double seconds = Seconds([&] {
        for (std::size_t i = 0; i < kLookups; ++i) {
            folder_mgr.GetMostSuitableCfg(path);
        }
    });
    std::printf("%-32s %.2f allocations; 0 wanted  %.1f ns per folder\n",
                "governing folder of a path",
                static_cast<double>(allocations - before) / (kLookups * kRepetitions),
                seconds * 1e9 / (kLookups * kFolders));
}

std::vector<std::string> WriteQueue(std::size_t count) {
    std::vector<std::string> lines(count);
    std::ofstream file(kQueuePath);
    for (std::size_t i = 0; i < count; ++i) {
        lines[i] = R"({"event":2,"is_dir":false,"path":"/volume1/photo/album )" +
                   std::to_string(i % 100) + "/IMG_" + std::to_string(20240000 + i) + R"(.jpeg"})";
        file << lines[i] << '\n';
    }
    return lines;
}

}  // namespace

int main(int argc, char** argv) {
    if (std::getenv("FILEINDEX_SANDBOX") == nullptr) {
        std::fprintf(stderr, "Run this as: scripts/sandbox %s\n", argv[0]);
        return 2;
    }
    quivra::fileindex::log_level = 6;
    const std::string text = Configure();
    Report("load 1000 folders", ParseSeconds({text}), Seconds([] { const FolderMgr loaded; }), 20);
    ReportLookup();

    const auto lines = WriteQueue(argc > 1 ? std::strtoul(argv[1], nullptr, 10) : 1000000);
    const double floor = ParseSeconds(lines);
    const QueueMgr queue(kQueuePath);
    Report("scan for pending work, no match", floor,
           Seconds([&] { queue.IsFullPathProcessing("/volume1/photo/none"); }), 1.3);
    unlink(kQueuePath);
    return 0;
}
