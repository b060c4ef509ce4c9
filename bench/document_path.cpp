// How much the way through library, socket and daemon costs: documents a second by IndexUpsert and
// IndexCommit, against the same documents added to a Xapian database in this process. Run it in the
// sandbox: scripts/sandbox build/release/bench/document_path [FILES]

#include <kesto/content_extract.h>
#include <xapian.h>

#include <chrono>
#include <cstdio>
#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <functional>
#include <random>
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
constexpr int kWordsPerFile = 150;
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

std::vector<std::string> MakeFiles(int count) {
    std::mt19937 random(1);
    const std::vector<std::string> words = MakeWords(random);
    std::vector<std::string> paths;
    for (int i = 0; i < count; ++i) {
        const std::string directory = kRoot + "/folder " + std::to_string(i / kFilesPerDirectory);
        fs::create_directories(directory);
        paths.push_back(directory + "/" + words[random() % kVocabulary] + std::to_string(i) +
                        ".txt");
        std::ofstream file(paths.back());
        for (int word = 0; word < kWordsPerFile; ++word) {
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

/// The terms that a search of the kind the daemon offers needs: words of every searched field, by
/// field and over all, parts of the name, ancestors of the path, values of numbers and dates.
Xapian::Document MakeDocument(const Json::Value& fields, Xapian::TermGenerator& generator) {
    Xapian::Document document;
    generator.set_document(document);
    unsigned int slot = 0;
    for (auto it = fields.begin(); it != fields.end(); ++it) {
        const std::string prefix = "X" + std::to_string(slot) + ":";
        if (it->isString()) {
            generator.index_text(it->asString(), 1, prefix);
            generator.index_text_without_positions(it->asString());
        } else {
            document.add_value(slot, Xapian::sortable_serialise(it->asDouble()));
        }
        ++slot;
    }
    const std::string name = fields["KESTOMDFSName"].asString();
    for (std::size_t size = 1; size <= 3; ++size) {
        for (std::size_t i = 0; i + size <= name.size(); ++i) {
            document.add_boolean_term("XN" + name.substr(i, size));
        }
    }
    const std::string path = fields["KESTOMDPath"].asString();
    document.add_boolean_term("Q" + path);
    for (std::size_t i = path.find('/', 1); i != std::string::npos; i = path.find('/', i + 1)) {
        document.add_boolean_term("XA" + path.substr(0, i));
    }
    document.set_data(quivra::toString(fields));
    return document;
}

double FloorSeconds(const std::vector<std::string>& paths) {
    std::vector<Json::Value> documents(paths.size());
    Json::Value cfg;
    cfg["need_meta"] = true;
    for (std::size_t i = 0; i < paths.size(); ++i) {
        KESTO::CONTENT_EXTRACT::ParseFile(paths[i], cfg, documents[i]);
    }
    return SecondsOf([&] {
        Xapian::WritableDatabase database("/volume1/floor", Xapian::DB_CREATE_OR_OVERWRITE);
        Xapian::TermGenerator generator;
        for (const Json::Value& fields : documents) {
            const std::string id = "Q" + fields["KESTOMDPath"].asString();
            database.replace_document(id, MakeDocument(fields, generator));
        }
        database.commit();
    });
}

double UpsertSeconds(const std::vector<std::string>& paths) {
    elastic::ShareIndexCreate("bench");
    return SecondsOf([&] {
        for (const std::string& path : paths) {
            elastic::IndexUpsert("bench", path, true);
        }
        elastic::IndexCommit("bench");
    });
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
    const support::Program engine =
        support::StartDaemon("kestoelasticd", "/var/run/kestoelasticd.sock");

    const double floor = FloorSeconds(paths);
    const double seconds = UpsertSeconds(paths);
    const auto count = static_cast<double>(paths.size());
    std::printf("documents                        %10.0f\n", count);
    std::printf("floor, Xapian in one process     %10.0f documents/s\n", count / floor);
    std::printf("library, socket and daemon       %10.0f documents/s\n", count / seconds);
    std::printf("ratio to the floor               %10.2f\n", seconds / floor);
    return 0;
}
