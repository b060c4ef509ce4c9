// How much the way through library, socket and daemon costs: documents a second by IndexUpsert and
// IndexCommit, against the same texts added to a bare FTS5 table (tokenizer unicode61) by one
// thread of this process. CPU time, and what was written, of the daemon are told apart. Run it in
// the sandbox: scripts/sandbox build/release/bench/document_path [FILES]

#include <kesto/content_extract.h>
#include <sqlite3.h>
#include <sys/resource.h>
#include <unistd.h>

#include <chrono>
#include <cmath>
#include <csignal>
#include <cstdio>
#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <functional>
#include <iterator>
#include <random>
#include <sstream>
#include <string>
#include <vector>

#include "common/json.h"
#include "common/log.h"
#include "fileindex/elastic/elastic_control.h"
#include "tests/support/program.h"

namespace {

namespace fs = std::filesystem;
namespace elastic = quivra::fileindex::elastic;
using Clock = std::chrono::steady_clock;

const std::string kRoot = "/volume1/bench";
constexpr int kFilesPerDirectory = 200;
/// Words of the smallest and of the largest text: 0.1 and 40 kB.
constexpr double kFewestWords = 14;
constexpr double kMostWords = 5300;
constexpr std::size_t kVocabulary = 20000;

std::vector<std::string> MakeWords(std::mt19937& random) {
    std::vector<std::string> words(kVocabulary);
    for (std::string& word : words) {
        for (std::size_t length = 3 + random() % 8; length > 0; --length) {
            word += static_cast<char>('a' + random() % 26);
        }
    }
    return words;
}

std::vector<std::string> MakeFiles(int files) {
    std::mt19937 random(1);
    const std::vector<std::string> words = MakeWords(random);
    std::vector<std::string> paths;
    for (int i = 0; i < files; ++i) {
        const std::string directory = kRoot + "/folder " + std::to_string(i / kFilesPerDirectory);
        fs::create_directories(directory);
        paths.push_back(directory + "/" + words[random() % kVocabulary] + std::to_string(i) +
                        ".txt");
        std::ofstream file(paths.back());
        // Small texts are as many as large ones are, octave by octave.
        const double size = std::generate_canonical<double, 32>(random);
        const double count = kFewestWords * std::pow(kMostWords / kFewestWords, size);
        for (int word = 0; word < static_cast<int>(count); ++word) {
            // Squared, so that some words are frequent, as in any language.
            const double position = std::generate_canonical<double, 32>(random);
            file << words[static_cast<std::size_t>(position * position * (kVocabulary - 1))] << ' ';
        }
    }
    return paths;
}

double SecondsOf(const std::function<void()>& work) {
    const auto start = Clock::now();
    work();
    return std::chrono::duration<double>(Clock::now() - start).count();
}

/// Seconds of CPU of this process so far.
double OwnCpu() {
    rusage usage{};
    getrusage(RUSAGE_SELF, &usage);
    const auto seconds = [](const timeval& time) {
        return static_cast<double>(time.tv_sec) + static_cast<double>(time.tv_usec) / 1e6;
    };
    return seconds(usage.ru_utime) + seconds(usage.ru_stime);
}

/// Of another process.
double CpuOf(pid_t pid) {
    std::ifstream stat("/proc/" + std::to_string(pid) + "/stat");
    std::string text;
    std::getline(stat, text);
    std::istringstream rest(text.substr(text.rfind(')') + 2));
    std::string skipped;
    for (int field = 3; field < 14; ++field) {
        rest >> skipped;
    }
    double user = 0;
    double system = 0;
    rest >> user >> system;
    return (user + system) / static_cast<double>(sysconf(_SC_CLK_TCK));
}

/// The number behind `name` in a file of /proc/PID.
double ProcNumber(pid_t pid, const char* file, const std::string& name) {
    std::ifstream in("/proc/" + std::to_string(pid) + "/" + file);
    for (std::string line; std::getline(in, line);) {
        if (line.starts_with(name)) {
            return std::atof(line.substr(name.size()).c_str());
        }
    }
    return 0;
}

struct Cost {
    double wall = 0;
    double cpu = 0;
};

Cost CostOf(const std::function<double()>& cpu, const std::function<void()>& work) {
    const double before = cpu();
    Cost cost;
    cost.wall = SecondsOf(work);
    cost.cpu = cpu() - before;
    return cost;
}

Cost Floor(const std::vector<std::string>& paths) {
    std::vector<std::string> texts;
    for (const std::string& path : paths) {
        std::ifstream file(path);
        texts.emplace_back(std::istreambuf_iterator<char>(file), std::istreambuf_iterator<char>());
    }
    sqlite3* database = nullptr;
    sqlite3_open("/volume1/floor", &database);
    const Cost cost = CostOf(OwnCpu, [&] {
        sqlite3_exec(database,
                     "PRAGMA journal_mode=WAL; CREATE VIRTUAL TABLE t USING fts5(text, content='');"
                     "BEGIN",
                     nullptr, nullptr, nullptr);
        sqlite3_stmt* insert = nullptr;
        sqlite3_prepare_v2(database, "INSERT INTO t(rowid, text) VALUES(?, ?)", -1, &insert,
                           nullptr);
        for (std::size_t i = 0; i < texts.size(); ++i) {
            sqlite3_bind_int64(insert, 1, static_cast<sqlite3_int64>(i) + 1);
            sqlite3_bind_text(insert, 2, texts[i].data(), static_cast<int>(texts[i].size()),
                              SQLITE_STATIC);
            sqlite3_step(insert);
            sqlite3_reset(insert);
        }
        sqlite3_finalize(insert);
        sqlite3_exec(database, "COMMIT", nullptr, nullptr, nullptr);
    });
    sqlite3_close(database);
    return cost;
}

Cost Upsert(const std::vector<std::string>& paths, pid_t daemon) {
    elastic::ShareIndexCreate("bench");
    return CostOf([&] { return OwnCpu() + CpuOf(daemon); },
                  [&] {
                      for (const std::string& path : paths) {
                          elastic::IndexUpsert("bench", path, true);
                      }
                      elastic::IndexCommit("bench");
                  });
}

double SizeOf(const std::string& directory) {
    double size = 0;
    for (const fs::directory_entry& entry : fs::recursive_directory_iterator(directory)) {
        size += entry.is_regular_file() ? static_cast<double>(entry.file_size()) : 0;
    }
    return size;
}

}  // namespace

int main(int argc, char** argv) {
    if (std::getenv("FILEINDEX_SANDBOX") == nullptr) {
        std::fprintf(stderr, "Run this as: scripts/sandbox %s\n", argv[0]);
        return 2;
    }
    quivra::fileindex::log_level = 0;
    const std::vector<std::string> paths = MakeFiles(argc > 1 ? std::atoi(argv[1]) : 20000);
    fs::create_directories("/etc/kesto");
    std::ofstream("/etc/kesto/shares.conf") << "[bench]\npath = " << kRoot << "\n";
    support::Program engine = support::StartDaemon("kestoelasticd", "/var/run/kestoelasticd.sock");

    const Cost floor = Floor(paths);
    const Cost cost = Upsert(paths, engine.Pid());
    const auto count = static_cast<double>(paths.size());
    const double texts = SizeOf(kRoot) - SizeOf(kRoot + "/@eaDir");
    const double daemon_cpu = CpuOf(engine.Pid());
    const double written = ProcNumber(engine.Pid(), "io", "write_bytes: ");
    const double memory = ProcNumber(engine.Pid(), "status", "VmHWM:") / 1024;
    engine.Stop(SIGTERM);  // the log goes into the file
    const double index = SizeOf(kRoot + "/@eaDir");
    std::printf("documents, MB of text            %10.0f %9.1f\n", count, texts / 1e6);
    std::printf("floor, bare FTS5: wall, CPU s    %10.2f %9.2f\n", floor.wall, floor.cpu);
    std::printf("library, socket, daemon          %10.2f %9.2f\n", cost.wall, cost.cpu);
    std::printf("of that, CPU s of the daemon     %20.2f\n", daemon_cpu);
    std::printf("ratio to the floor               %10.2f %9.2f\n", cost.wall / floor.wall,
                cost.cpu / floor.cpu);
    std::printf("index: MB, to the text           %10.1f %9.2f\n", index / 1e6, index / texts);
    std::printf("daemon wrote (no tmpfs): MB      %10.1f\n", written / 1e6);
    std::printf("daemon's memory, highest: MB     %10.1f\n", memory);
    return 0;
}
