#pragma once

#include "platform/StructuredLog.h"

#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <stdexcept>
#include <string>
#include <string_view>

#include <stdlib.h>
#include <unistd.h>

// What the fuzzers have in common.

namespace tamblo::fuzz {

/// A fault that the fuzzer keeps the input of.
inline void demand(bool condition) {
    if (!condition) {
        std::abort();
    }
}

/// Formats what it is given, and keeps nothing.
class SilentLog final : public StructuredLog {
public:
    [[nodiscard]] LogLevel threshold(std::string_view) const noexcept override { return LogLevel::error; }
    void write(LogLevel, std::string_view, std::string_view line) noexcept override { demand(!line.empty()); }
};

/// A directory in memory, where there is such a place. Removed when its process ends in order.
class ScratchDirectory {
public:
    ScratchDirectory() {
        const bool isMemory = std::filesystem::is_directory("/dev/shm");
        path_ = (isMemory ? std::string("/dev/shm") : std::filesystem::temp_directory_path().string()) +
                "/tamblo-fuzz-XXXXXX";
        if (::mkdtemp(path_.data()) == nullptr) {
            throw std::runtime_error("no directory for files");
        }
    }
    ~ScratchDirectory() {
        std::error_code ignored;
        std::filesystem::remove_all(path_, ignored);
    }
    ScratchDirectory(const ScratchDirectory&) = delete;
    ScratchDirectory& operator=(const ScratchDirectory&) = delete;

    [[nodiscard]] std::string path(std::string_view name = {}) const {
        return name.empty() ? path_ : path_ + "/" + std::string(name);
    }
    void write(std::string_view name, std::string_view content) const {
        const std::filesystem::path file = path(name);
        std::filesystem::create_directories(file.parent_path());
        std::ofstream(file, std::ios::binary) << content;
    }
    [[nodiscard]] std::string read(std::string_view name) const {
        std::ifstream file(path(name), std::ios::binary);
        return {std::istreambuf_iterator<char>(file), {}};
    }

private:
    std::string path_;
};

} // namespace tamblo::fuzz
