#include <gtest/gtest.h>

#include <cstdlib>
#include <iostream>

int main(int argc, char** argv) {
    testing::InitGoogleTest(&argc, argv);
    // The tests write to fixed paths such as /var/packages and kill daemons: never on the real
    // ones.
    if (std::getenv("FILEINDEX_SANDBOX") == nullptr && !GTEST_FLAG_GET(list_tests)) {
        std::cerr << "Run this test as: scripts/sandbox " << argv[0] << "\n";
        return 2;
    }
    return RUN_ALL_TESTS();
}
