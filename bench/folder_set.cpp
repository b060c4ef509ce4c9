// The folder set, the operations on it and the scan for pending work. The floors are bare parses
// with the JSON reader, reused, of the same text in memory; of the operations, what any check of a
// path asks the kernel. Writes to the library's fixed paths, so run it as:
//
//   scripts/sandbox build/release/bench/folder_set [LINES]     (default 1000000)

#include <json/json.h>
#include <sys/vfs.h>
#include <time.h>
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
#include "fileindex/index_mgr.h"
#include "fileindex/queue_mgr.h"
#include "tests/fake/scripted_server.h"

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
/// 0.3 s beside a floor of 10 ms.
constexpr double kOperationRatio = 30;
constexpr const char* kQueuePath = "/tmp/folder_set.queue";

/// What the process itself has used: the operations also start programs of the platform, whose time
/// is not theirs, and waits are as long as the machine is busy.
double CpuSeconds(const std::function<void()>& work) {
    const auto now = [] {
        timespec time{};
        clock_gettime(CLOCK_PROCESS_CPUTIME_ID, &time);
        return static_cast<double>(time.tv_sec) + static_cast<double>(time.tv_nsec) * 1e-9;
    };
    const double start = now();
    work();
    return now() - start;
}

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

std::vector<std::string> WriteQueue(const char* path, std::size_t count) {
    std::vector<std::string> lines(count);
    std::ofstream file(path);
    for (std::size_t i = 0; i < count; ++i) {
        lines[i] = R"({"event":2,"is_dir":false,"path":"/volume1/photo/album )" +
                   std::to_string(i % 100) + "/IMG_" + std::to_string(20240000 + i) + R"(.jpeg"})";
        file << lines[i] << '\n';
    }
    return lines;
}

Json::Value Paths(const Json::Value& folders) {
    Json::Value paths(Json::arrayValue);
    for (const Json::Value& folder : folders) {
        paths.append(folder["path"]);
    }
    return paths;
}

/// The operations on as many folders as may be configured, while 10,000 lines wait. Both daemons
/// reply at once. All but the list hold the folder lock: so long does everybody else wait.
void ReportOperations(const std::string& text) {
    namespace library = quivra::fileindex;
    const fake::ScriptedServer search("/var/run/kestoelasticd.sock");
    const fake::ScriptedServer indexer("/var/run/fileindexd.sock");
    Json::Value folders;
    quivra::fromString(folders, text);
    std::vector<std::string> full_paths;
    for (const Json::Value& folder : folders) {
        full_paths.push_back("/volume1" + folder["path"].asString());
        std::filesystem::create_directories(full_paths.back());
    }
    const double floor = CpuSeconds([&] {
        for (const std::string& path : full_paths) {
            struct statfs status {};
            std::free(realpath(path.c_str(), nullptr));
            if (statfs(path.c_str(), &status) != 0) {
                std::abort();
            }
        }
    });
    const char* queue = "/volume1/photo/@eaDir/fileindex/queue";
    const auto report = [&](const char* name, const std::function<void()>& work) {
        std::filesystem::create_directories("/volume1/photo/@eaDir/fileindex");
        WriteQueue(queue, 10000);
        Report(name, floor, CpuSeconds(work), kOperationRatio);
    };
    unlink(library::kFileIndexFoldersCfgPath);
    report("add 1000 folders", [&] { library::FolderAdd(folders, false); });
    for (Json::Value& folder : folders) {
        folder["audio"] = true;
    }
    report("change 1000 folders", [&] { library::FolderSet(folders, false); });
    report("list 1000 folders with status", [&] {
        Json::Value result;
        Json::Value additional;
        additional.append("status");
        library::FolderList(result, 0, kFolders, "name", "", additional);
    });
    report("delete 1000 folders", [&] { library::FolderDelete(Paths(folders)); });
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

    ReportOperations(text);

    const auto lines =
        WriteQueue(kQueuePath, argc > 1 ? std::strtoul(argv[1], nullptr, 10) : 1000000);
    const double floor = ParseSeconds(lines);
    const QueueMgr queue(kQueuePath);
    Report("scan for pending work, no match", floor,
           Seconds([&] { queue.IsFullPathProcessing("/volume1/photo/none"); }), 1.3);
    unlink(kQueuePath);
    return 0;
}
