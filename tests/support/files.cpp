#include "tests/support/files.h"

#include <sys/stat.h>

#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <iterator>
#include <stdexcept>

#include "base/frame.h"
#include "base/path.h"

namespace support {

bool WriteFile(const std::string& path, std::string_view content) {
    const std::string directory(quivra::base::Directory(path));
    std::error_code ignored;  // the open below fails then
    std::filesystem::create_directories(directory, ignored);
    std::ofstream file(path, std::ios::binary | std::ios::trunc);
    file << content << std::flush;
    return file.good();
}

std::string ReadFile(const std::string& path) {
    std::ifstream file(path, std::ios::binary);
    return {std::istreambuf_iterator<char>(file), {}};
}

unsigned int ModeOf(const std::string& path) {
    struct stat status {};
    return lstat(path.c_str(), &status) == 0 ? status.st_mode & 07777 : 0;
}

std::string Frame(std::string_view message) {
    const auto prefix = quivra::base::MakeFramePrefix(message.size());
    return std::string(prefix.begin(), prefix.end()).append(message);
}

TemporaryDirectory::TemporaryDirectory() {
    if (mkdtemp(path_.data()) == nullptr) {
        throw std::runtime_error("cannot make " + path_);
    }
}

TemporaryDirectory::~TemporaryDirectory() {
    std::error_code ignored;
    std::filesystem::remove_all(path_, ignored);
}

std::string TemporaryDirectory::operator/(std::string_view name) const {
    return quivra::base::Join(path_, name);
}

}  // namespace support
