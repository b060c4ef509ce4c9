#include "programs/fileindexctl/search_query.h"

#include <cstdlib>
#include <ctime>

#include "programs/fileindexctl/session.h"
#include "tests/fileindex/library_fixture.h"

namespace quivra::ctl {
namespace {

class SearchQueryTest : public testing::Test {
  protected:
    SearchQueryTest() {
        setenv("TZ", "UTC", 1);
        tzset();
    }
};

std::string Anywhere(const std::string& text) {
    return R"({"any":[{"match":{"_all":")" + text + R"("}},{"match":{"KESTOMDSearchFileName":")" +
           text + R"("}}]})";
}

TEST_F(SearchQueryTest, EveryFormOfWord) {
    struct Row {
        std::vector<std::string> words;
        std::string clauses;
    };
    const Row rows[] = {
        {{"whale"}, Anywhere("whale")},
        {{"blue", "whale"}, Anywhere("blue") + "," + Anywhere("whale")},
        {{" blue  whale\t"}, Anywhere("blue") + "," + Anywhere("whale")},
        {{"\"blue whale\""}, Anywhere("blue whale")},
        {{"-draft"}, R"({"not":)" + Anywhere("draft") + "}"},
        {{"\"-draft\""}, Anywhere("-draft")},
        {{"well-known"}, Anywhere("well-known")},
        {{"title:whale"}, R"({"match":{"KESTOMDTitle":"whale"}})"},
        {{"http://x", "title:", ":x"},
         Anywhere("http://x") + "," + Anywhere("title:") + "," + Anywhere(":x")},
        {{"ext:PDF"}, R"({"term":{"KESTOMDExtension":"pdf"}})"},
        {{"KESTOMDAperture:f/2"}, R"({"term":{"KESTOMDAperture":"f/2"}})"},
        {{"KESTOMDISOSpeed:100"}, R"({"range":{"KESTOMDISOSpeed":{"gte":100,"lte":100}}})"},
        {{"size:>=1.5K"}, R"({"range":{"KESTOMDFSSize":{"gte":1536}}})"},
        {{"size:1M..2m"}, R"({"range":{"KESTOMDFSSize":{"gte":1048576,"lte":2097152}}})"},
        {{"modified:1970-01-02"},
         R"({"range":{"KESTOMDFSContentChangeDate":{"gte":86400,"lt":172800}}})"},
        {{"modified:<=1970-01-02"}, R"({"range":{"KESTOMDFSContentChangeDate":{"lt":172800}}})"},
    };
    for (const Row& row : rows) {
        EXPECT_EQ(MakeQuery(row.words), fileindex::Parse(R"({"all":[)" + row.clauses + "]}"))
            << testing::PrintToString(row.words);
    }
}

TEST_F(SearchQueryTest, WhatMakesNoSenseIsAWrongCall) {
    const std::vector<std::string> rows[] = {
        {},          {""},         {"  ", "\"\""}, {"-"},        {"size:big"},
        {"size:>"},  {"size:1K2"}, {"size:nan"},   {"year:10M"}, {"modified:yesterday"},
        {"size:.."}, {"size:inf"},
    };
    for (const std::vector<std::string>& row : rows) {
        EXPECT_THROW(MakeQuery(row), WrongCall) << testing::PrintToString(row);
    }
}

}  // namespace
}  // namespace quivra::ctl
