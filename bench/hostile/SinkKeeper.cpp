#include "SinkKeeper.h"

#include <charconv>
#include <filesystem>
#include <fstream>
#include <set>
#include <system_error>

#include <sys/stat.h>
#include <unistd.h>

namespace tamblo::bench {

namespace fs = std::filesystem;

void SinkKeeper::keep() const {
    // A flood may have the file turned over twice in the time between two looks.
    for (const char* const name : {"analytics-events.jsonl.1", "analytics-events.jsonl"}) {
        const std::string file = logs_ + "/" + name;
        struct stat status {};
        if (::stat(file.c_str(), &status) == 0) {
            // Fails for one that is kept already.
            (void)!::link(file.c_str(), (kept_ + "/" + std::to_string(status.st_ino)).c_str());
        }
    }
}

SinkKeeper::Files SinkKeeper::files() const {
    Files files;
    std::set<ino_t> seen;
    for (const std::string& directory : {logs_, kept_}) {
        std::error_code ignored;
        for (const auto& entry : fs::recursive_directory_iterator(directory, ignored)) {
            struct stat status {};
            if (::lstat(entry.path().c_str(), &status) == 0 && S_ISREG(status.st_mode) &&
                seen.insert(status.st_ino).second) {
                const auto size = static_cast<std::uint64_t>(status.st_size);
                ++files.count;
                files.bytes += size;
                files.largest = std::max(files.largest, size);
            }
        }
    }
    return files;
}

std::vector<std::uint32_t> SinkKeeper::countNumbers(const std::string& event, const std::string& key,
                                                    std::uint64_t highest) const {
    const std::string name = "\"event\":\"" + event + "\"";
    const std::string before = "\"" + key + "\":";
    std::vector<std::uint32_t> counts(highest + 1);
    for (const auto& entry : fs::directory_iterator(kept_)) {
        std::ifstream lines(entry.path(), std::ios::binary);
        for (std::string line; std::getline(lines, line);) {
            // The name stands at the front of a line that may be long.
            if (line.find(name) > 64) {
                continue;
            }
            const std::size_t at = line.find(before);
            std::uint64_t number = 0;
            if (at != line.npos &&
                std::from_chars(line.data() + at + before.size(), line.data() + line.size(), number).ec ==
                    std::errc() &&
                number < counts.size()) {
                ++counts[number];
            }
        }
    }
    return counts;
}

} // namespace tamblo::bench
