// How fast a queue becomes a tree. The floor is what no implementation can do without: parsing the
// same lines, in memory, with the bare JSON reader. Debug lines are switched off, as in a host that
// lowered log_level.
//
//   coalescing [LINES]     (default 1000000)
//   coalescing LINES loops     only what somebody does over and over again

#include <json/json.h>
#include <malloc.h>
#include <unistd.h>

#include <algorithm>
#include <cmath>
#include <cstdio>
#include <cstdlib>
#include <ctime>
#include <fstream>
#include <functional>
#include <memory>
#include <random>
#include <string>
#include <vector>

#include "common/log.h"
#include "fileindex/optree.h"

namespace {

using quivra::fileindex::OPTree;
using Lines = std::vector<std::string>;

constexpr int kRepetitions = 3;
constexpr std::size_t kMaxMemoryPerFile = 512;

std::string Line(unsigned int bits, const std::string& path, const std::string& old = "") {
    std::string line = R"({"event":)" + std::to_string(bits) + R"(,"is_dir":)" +
                       (old.empty() ? "false" : "true") + R"(,"path":")" + path + '"';
    return line + (old.empty() ? "" : R"(,"path_old":")" + old + '"') + '}';
}

/// A file of a tree with 100 directories of 10 directories each.
std::string TreePath(std::size_t i) {
    return "/volume1/photo/album " + std::to_string(i % 100) + "/part " +
           std::to_string(i / 100 % 10) + "/IMG_" + std::to_string(20240000 + i) + ".jpeg";
}

constexpr unsigned int kBits[] = {0x40, 0x2, 0x2, 0x4, 0x2, 0x2, 0x4, 0x2, 0x4, 0x2};

/// Ten lines for each file, directory by directory, as a copy or an unpacked archive gives them.
Lines BusyDirectories(std::size_t count) {
    const std::size_t files = count / 10;
    Lines lines;
    for (std::size_t directory = 0; directory < 1000; ++directory) {
        for (const unsigned int bits : kBits) {
            for (std::size_t file = directory; file < files; file += 1000) {
                lines.push_back(Line(bits, TreePath(file)));
            }
        }
    }
    return lines;
}

/// As many lines in random order: every line finds the caches cold.
Lines ShuffledTree(std::size_t count) {
    std::mt19937 random(1);
    Lines lines(count);
    for (std::string& line : lines) {
        line = Line(kBits[random() % 10], TreePath(random() % (count / 10)));
    }
    return lines;
}

Lines OneDirectory(std::size_t count) {
    Lines lines(count);
    for (std::size_t i = 0; i < count; ++i) {
        lines[i] =
            Line(0x40, "/volume1/photo/camera/IMG_" + std::to_string(20240000 + i) + ".jpeg");
    }
    return lines;
}

Lines PendingTree(std::size_t count) {
    Lines lines(count);
    for (std::size_t i = 0; i < count; ++i) {
        lines[i] = Line(0x2, TreePath(i));
    }
    return lines;
}

/// What programs and people do over and over again with the same few names. A line of each is
/// folded into what all the lines before it have left.
struct Loop {
    const char* name;
    /// Appends one round; `round` counts from 0.
    void (*add)(Lines& lines, std::size_t round);
    /// Appends what comes before the first round, a part of `count` lines.
    void (*begin)(Lines& lines, std::size_t count);
};

std::string Made(const std::string& path) {
    return R"({"event":64,"is_dir":true,"path":")" + path + "\"}";
}

std::string Removed(const std::string& path) {
    return R"({"event":128,"is_dir":true,"path":")" + path + "\"}";
}

std::string Settings(const std::string& path) {
    return R"({"event":131072,"path":")" + path + R"(","data":{"audio":true}})";
}

std::string Moved(const std::string& from, const std::string& to) {
    return Line(0x100, to, from);
}

void Nothing(Lines&, std::size_t) {}

void FilesIn(const std::string& directory, Lines& lines, std::size_t count) {
    for (std::size_t i = 0; i < count; ++i) {
        lines.push_back(Line(0x40, directory + "/" + std::to_string(i)));
    }
}

void HalfInD(Lines& lines, std::size_t count) {
    FilesIn("/v/d", lines, count / 2);
}

const Loop kLoops[] = {
    {"rmdir, mkdir over files come and gone",
     [](Lines& lines, std::size_t) {
         lines.insert(lines.end(), {Removed("/v/d"), Made("/v/d")});
     },
     [](Lines& lines, std::size_t count) {
         for (std::size_t i = 0; i < count / 4; ++i) {
             lines.push_back(Line(0x40, "/v/d/" + std::to_string(i)));
             lines.push_back(Line(0x80, "/v/d/" + std::to_string(i)));
         }
     }},
    {"a new file in d, a reindex of d",
     [](Lines& lines, std::size_t round) {
         lines.push_back(Line(0x40, "/v/d/" + std::to_string(round)));
         lines.push_back(Line(0x10000, "/v/d"));
     },
     Nothing},
    {"two names swapped through a third",
     [](Lines& lines, std::size_t) {
         lines.insert(lines.end(),
                      {Moved("/v/a", "/v/t"), Moved("/v/b", "/v/a"), Moved("/v/t", "/v/b")});
     },
     Nothing},
    {"mv b a, mv a b",
     [](Lines& lines, std::size_t) {
         lines.insert(lines.end(), {Moved("/v/b", "/v/a"), Moved("/v/a", "/v/b")});
     },
     Nothing},
    {"the same, each written to before",
     [](Lines& lines, std::size_t) {
         lines.insert(lines.end(), {Line(0x2, "/v/a"), Moved("/v/b", "/v/a"), Line(0x2, "/v/b"),
                                    Moved("/v/a", "/v/b")});
     },
     Nothing},
    {"a directory to and fro, nothing pending",
     [](Lines& lines, std::size_t) {
         lines.insert(lines.end(), {Moved("/v/d", "/v/e"), Moved("/v/e", "/v/d")});
     },
     [](Lines& lines, std::size_t count) {
         HalfInD(lines, count);
         lines.push_back(Line(0x10000, "/v/d"));
     }},
    {"a directory to and fro over files",
     [](Lines& lines, std::size_t) {
         lines.insert(lines.end(), {Moved("/v/d", "/v/e"), Moved("/v/e", "/v/d")});
     },
     HalfInD},
    {"two directories of files swapped",
     [](Lines& lines, std::size_t) {
         lines.insert(lines.end(),
                      {Moved("/v/d", "/v/t"), Moved("/v/e", "/v/d"), Moved("/v/t", "/v/e")});
     },
     [](Lines& lines, std::size_t count) {
         FilesIn("/v/d", lines, count / 4);
         FilesIn("/v/e", lines, count / 4);
     }},
    {"a rename onto itself, over files",
     [](Lines& lines, std::size_t) { lines.push_back(Moved("/v/d", "/v/d")); }, HalfInD},
    {"publishing: mkdir tmp, rmdir, mv tmp",
     [](Lines& lines, std::size_t) {
         lines.insert(lines.end(), {Made("/v/tmp"), Removed("/v/cur"), Moved("/v/tmp", "/v/cur")});
     },
     Nothing},
    {"publishing with a file in it",
     [](Lines& lines, std::size_t) {
         lines.insert(lines.end(), {Made("/v/tmp"), Line(0x40, "/v/tmp/f"), Removed("/v/cur"),
                                    Moved("/v/tmp", "/v/cur")});
     },
     Nothing},
    {"settings that pile up on one name",
     [](Lines& lines, std::size_t) {
         lines.insert(lines.end(), {Settings("/v/a"), Moved("/v/a", "/v/b"), Settings("/v/b")});
     },
     Nothing},
    {"reindexes that pile up on one name",
     [](Lines& lines, std::size_t) {
         lines.insert(lines.end(), {Line(0x10000, "/v/a"), Moved("/v/a", "/v/b"),
                                    Line(0x80, "/v/b"), Line(0x10000, "/v/b")});
     },
     Nothing},
    {"upserts that pile up and are deleted",
     [](Lines& lines, std::size_t) {
         lines.insert(lines.end(), {Line(0x40, "/v/d/f"), Moved("/v/d", "/v/e"),
                                    Line(0x80, "/v/e/f"), Line(0x40, "/v/e/f")});
     },
     Nothing},
};

/// The first needs a change in the directory between any two renames of it, the second no file
/// system allows.
const Loop kHardLoops[] = {
    {"a directory to and fro, a file written to",
     [](Lines& lines, std::size_t) {
         lines.insert(lines.end(), {Moved("/v/d", "/v/e"), Line(0x2, "/v/e/0"),
                                    Moved("/v/e", "/v/d"), Line(0x2, "/v/d/0")});
     },
     HalfInD},
    {"a directory into its own subtree",
     [](Lines& lines, std::size_t) { lines.push_back(Moved("/v/d", "/v/d/d")); }, Nothing},
};

/// Processor time: all work is done by this thread, and other processes must not count.
double Seconds(const std::function<void()>& work) {
    const std::clock_t start = std::clock();
    work();
    return static_cast<double>(std::clock() - start) / CLOCKS_PER_SEC;
}

double ParseSeconds(const Lines& lines) {
    Json::CharReaderBuilder builder;
    builder["collectComments"] = false;
    const std::unique_ptr<Json::CharReader> reader(builder.newCharReader());
    return Seconds([&] {
        for (const std::string& line : lines) {
            Json::Value value;
            if (!reader->parse(line.data(), line.data() + line.size(), &value, nullptr)) {
                std::abort();
            }
        }
    });
}

struct Result {
    double floor = 1e9;  ///< seconds
    double total = 1e9;  ///< seconds to read the file, build the tree, process it and drop it
    std::size_t memory = 0;
    int surviving = 0;
};

Result Measure(const Lines& lines) {
    char path[] = "/tmp/coalescing.XXXXXX";
    const int fd = mkstemp(path);
    std::ofstream file(path);
    for (const std::string& line : lines) {
        file << line << '\n';
    }
    file.close();
    Result result;
    for (int i = 0; i < kRepetitions; ++i) {
        result.floor = std::min(result.floor, ParseSeconds(lines));
        result.total = std::min(result.total, Seconds([&] {
                                    const std::size_t before = mallinfo2().uordblks;
                                    OPTree tree(path);
                                    result.memory = mallinfo2().uordblks - before;
                                    result.surviving = 0;
                                    tree.ProcessOP([&](auto) { ++result.surviving; });
                                }));
    }
    close(fd);
    unlink(path);
    return result;
}

Result Report(const char* name, const Lines& lines) {
    const Result result = Measure(lines);
    std::printf("%-36s %8zu lines %8d ops  floor %7.1f ms  total %7.1f ms  ratio %.2f\n", name,
                lines.size(), result.surviving, result.floor * 1e3, result.total * 1e3,
                result.total / result.floor);
    return result;
}

void ReportGrowth(const char* name, Lines (*make)(std::size_t), std::size_t count) {
    const Result small = Report(name, make(count / 10));
    const Result large = Report(name, make(count));
    std::printf("    growth from a tenth: %.1f times (floor %.1f); at most 11 wanted\n",
                large.total / small.total, large.floor / small.floor);
}

/// The exponent is taken from a quarter of the lines and all of them: 1 is linear, 2 quadratic.
void ReportLoop(const Loop& loop, std::size_t count) {
    const auto make = [&](std::size_t size) {
        Lines lines;
        loop.begin(lines, size);
        for (std::size_t round = 0; lines.size() < size; ++round) {
            loop.add(lines, round);
        }
        return Measure(lines);
    };
    const Result small = make(count / 4);
    const Result large = make(count);
    std::printf("%-40s %8zu lines  ratio %5.2f  exponent %.2f\n", loop.name, count,
                large.total / large.floor, std::log(large.total / small.total) / std::log(4.0));
}

void ReportMemory(const char* name, const Lines& lines) {
    const Result result = Measure(lines);
    std::printf("%-36s %zu bytes per pending file; at most %zu wanted\n", name,
                result.memory / static_cast<std::size_t>(result.surviving), kMaxMemoryPerFile);
}

}  // namespace

int main(int argc, char** argv) {
    const std::size_t count = argc > 1 ? std::strtoul(argv[1], nullptr, 10) : 1000000;
    quivra::fileindex::log_level = 6;
    std::printf("floor: the bare parse of the same lines; best of %d runs\n", kRepetitions);
    if (argc <= 2) {
        std::printf("\nratio 1.30 wanted\n");
        ReportGrowth("ten lines a file, by directory", BusyDirectories, count);
        ReportGrowth("ten lines a file, in random order", ShuffledTree, count);
        ReportGrowth("distinct files of one directory", OneDirectory, count);

        Lines lines = PendingTree(count / 10);
        Report("pending files", lines);
        lines.push_back(Line(0x100, "/volume1/photo 2", "/volume1/photo"));
        Report("a directory rename above them", lines);
        lines.back() = Line(0x10000, "/volume1/photo");
        Report("a reindex above them", lines);

        ReportMemory("memory, files of a tree", PendingTree(count));
        ReportMemory("memory, files of one directory", OneDirectory(count));
    }
    std::printf("\nloops: ratio below 4 and exponent at most 1.1 wanted\n");
    for (const Loop& loop : kLoops) {
        ReportLoop(loop, count);
    }
    std::printf("\nloops that are not linear, over a hundredth of the lines\n");
    for (const Loop& loop : kHardLoops) {
        ReportLoop(loop, count / 100);
    }
    return 0;
}
