#include "tests/support/index_state.h"

#include <gtest/gtest.h>

#include <filesystem>

#include "fileindex/elastic/elastic_control.h"
#include "tests/support/files.h"

namespace support {
namespace {

namespace fs = std::filesystem;

std::string Lines(const std::string& label, const Contents& some, const Contents& other) {
    std::string lines;
    for (const auto& [path, content] : some) {
        const auto found = other.find(path);
        if (found == other.end() || found->second != content) {
            lines += label + path + " = " + content.substr(0, 40) + "\n";
        }
    }
    return lines;
}

}  // namespace

Contents ContentsOnDisk(const std::string& root) {
    Contents contents;
    for (auto it = fs::recursive_directory_iterator(root); it != fs::end(it); ++it) {
        if (it->path().filename() == "@eaDir") {
            it.disable_recursion_pending();
        } else {
            contents[it->path()] = it->is_directory() ? "/" : ReadFile(it->path());
        }
    }
    return contents;
}

Contents ContentsInIndex(const std::string& share, const std::string& root) {
    Json::Value query;
    query["qsl"]["prefix"]["KESTOMDPath"] = root + "/";
    for (const char* field : {"KESTOMDPath", "KESTOMDIsDir", "KESTOMDTextContent"}) {
        query["fields"].append(field);
    }
    Json::Value reply;
    quivra::fileindex::elastic::IndexQuery(reply, share, query);
    Contents contents;
    for (const Json::Value& hit : reply["data"]) {
        const std::string path = hit["KESTOMDPath"].asString();
        EXPECT_EQ(contents.count(path), 0U) << "twice in the index: " << path;
        contents[path] = hit["KESTOMDIsDir"].asBool() ? "/" : hit["KESTOMDTextContent"].asString();
    }
    return contents;
}

std::string Difference(const Contents& disk, const Contents& index) {
    return Lines("on disk only:      ", disk, index) + Lines("in the index only: ", index, disk);
}

}  // namespace support
