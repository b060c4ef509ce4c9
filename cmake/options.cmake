# Build switches, in one place. Everything is on by default except what needs a special compiler.
option(FILEINDEX_BUILD_TESTS "Build the tests" ON)
option(FILEINDEX_BUILD_BENCH "Build the benchmarks" ON)
option(FILEINDEX_BUILD_FUZZ "Build the fuzzers (needs clang)" OFF)
option(FILEINDEX_WERROR "Treat warnings as errors" OFF)
set(FILEINDEX_SANITIZE "" CACHE STRING "Sanitizers for all targets, for example address,undefined")

if(NOT CMAKE_BUILD_TYPE)
    set(CMAKE_BUILD_TYPE RelWithDebInfo CACHE STRING "Build type" FORCE)
endif()

set(CMAKE_CXX_STANDARD 20)
set(CMAKE_CXX_STANDARD_REQUIRED ON)
set(CMAKE_CXX_EXTENSIONS OFF)
set(CMAKE_POSITION_INDEPENDENT_CODE ON)
set(CMAKE_CXX_VISIBILITY_PRESET hidden)
set(CMAKE_VISIBILITY_INLINES_HIDDEN ON)
set(CMAKE_EXPORT_COMPILE_COMMANDS ON)

add_compile_options(-Wall -Wextra -Wpedantic -Wshadow -Wconversion)
if(FILEINDEX_WERROR)
    add_compile_options(-Werror)
endif()
if(FILEINDEX_SANITIZE)
    add_compile_options(-fsanitize=${FILEINDEX_SANITIZE} -fno-omit-frame-pointer
                        -fno-sanitize-recover=all)
    add_link_options(-fsanitize=${FILEINDEX_SANITIZE})
endif()
if(FILEINDEX_BUILD_FUZZ)
    # Without it in the code under test, the fuzzers would not see which inputs reach new places.
    add_compile_options(-fsanitize=fuzzer-no-link
                        -fsanitize-ignorelist=${PROJECT_SOURCE_DIR}/fuzz/ignorelist.txt)
    add_link_options(-fsanitize=fuzzer-no-link)
endif()

# Headers are included from the repository root ("common/error.h") and the platform's as
# <kesto/...>.
include_directories(${PROJECT_SOURCE_DIR})
