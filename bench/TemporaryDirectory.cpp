#include "TemporaryDirectory.h"

#include <cerrno>
#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <stdexcept>
#include <system_error>

namespace tamblo::bench {

namespace {

std::string usualParent() {
    const char* parent = std::getenv("TMPDIR");
    return parent != nullptr ? parent : BENCH_DIRECTORY;
}

} // namespace

TemporaryDirectory::TemporaryDirectory(const std::string& parent)
    : path_((parent.empty() ? usualParent() : parent) + "/tamblo-bench.XXXXXX") {
    if (mkdtemp(path_.data()) == nullptr) {
        throw std::system_error(errno, std::generic_category(), path_);
    }
}

TemporaryDirectory::~TemporaryDirectory() {
    std::error_code ignored;
    std::filesystem::remove_all(path_, ignored);
}

void TemporaryDirectory::makeDirectory(const std::string& name) const {
    std::filesystem::create_directories(path_ + "/" + name);
}

void TemporaryDirectory::write(const std::string& name, const std::string& content) const {
    std::ofstream file(path_ + "/" + name, std::ios::binary);
    file << content;
    if (!file.flush()) {
        throw std::runtime_error("cannot write " + path_ + "/" + name);
    }
}

} // namespace tamblo::bench
