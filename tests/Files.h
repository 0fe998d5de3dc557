#pragma once

#include <filesystem>
#include <fstream>
#include <iterator>
#include <sstream>
#include <stdexcept>
#include <string>
#include <string_view>
#include <vector>

#include <stdlib.h>

namespace tamblo::test {

/// Nothing and an empty file read the same.
[[nodiscard]] inline std::string contentOf(const std::filesystem::path& path) {
    std::ifstream file(path, std::ios::binary);
    return {std::istreambuf_iterator<char>(file), {}};
}

/// The lines that are complete.
[[nodiscard]] inline std::vector<std::string> linesOf(const std::filesystem::path& path) {
    std::vector<std::string> lines;
    std::istringstream text(contentOf(path));
    for (std::string line; std::getline(text, line) && !text.eof();) {
        lines.push_back(line);
    }
    return lines;
}

/// With the directories that it takes.
inline void writeFile(const std::filesystem::path& path, std::string_view text,
                      std::ios::openmode mode = std::ios::binary) {
    std::filesystem::create_directories(path.parent_path());
    std::ofstream(path, mode) << text;
}

[[nodiscard]] inline std::ptrdiff_t entriesOf(const std::filesystem::path& directory) {
    return std::distance(std::filesystem::directory_iterator(directory), {});
}

} // namespace tamblo::test

namespace tamblo {

/// A directory that goes away with its owner.
class TemporaryDirectory {
public:
    explicit TemporaryDirectory(const std::filesystem::path& parent = std::filesystem::temp_directory_path())
        : path_(parent / "tamblo-test-XXXXXX") {
        if (::mkdtemp(path_.data()) == nullptr) {
            throw std::runtime_error("no temporary directory");
        }
    }
    ~TemporaryDirectory() {
        std::error_code ignored;
        std::filesystem::remove_all(path_, ignored);
    }
    TemporaryDirectory(const TemporaryDirectory&) = delete;
    TemporaryDirectory& operator=(const TemporaryDirectory&) = delete;

    [[nodiscard]] std::string path(const std::string& name = {}) const {
        return name.empty() ? path_ : path_ + "/" + name;
    }
    void write(const std::string& name, std::string_view text) const { test::writeFile(path(name), text); }
    [[nodiscard]] std::string read(const std::string& name) const { return test::contentOf(path(name)); }

private:
    std::string path_;
};

} // namespace tamblo
