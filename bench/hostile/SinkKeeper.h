#pragma once

#include <cstdint>
#include <string>
#include <vector>

namespace tamblo::bench {

/// Keeps every file that the analytics sink has begun, by a second name, as a shipper of logs would: what an
/// attack pushes out of the four that the service keeps is still there to be looked at and counted.
class SinkKeeper {
public:
    /// The directory of the sinks, and one beside it on the same file system, which must be there.
    SinkKeeper(std::string logsDirectory, std::string keptDirectory)
        : logs_(std::move(logsDirectory)), kept_(std::move(keptDirectory)) {}

    /// To be called again before a file can have been filled.
    void keep() const;

    /// What all sinks' files, summary files and the like take.
    struct Files {
        std::uint64_t count = 0;
        std::uint64_t bytes = 0;
        std::uint64_t largest = 0;
    };
    [[nodiscard]] Files files() const;

    /// How often each number up to the highest stands behind the key in lines of this event, by number.
    [[nodiscard]] std::vector<std::uint32_t> countNumbers(const std::string& event, const std::string& key,
                                                          std::uint64_t highest) const;

private:
    std::string logs_;
    std::string kept_;
};

} // namespace tamblo::bench
