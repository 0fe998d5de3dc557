#pragma once

#include <cstdint>
#include <string>
#include <string_view>

namespace tamblo::tools {

/// The identifiers of a file's records: DEVICE/SINK/FILE/OFFSET-CHECK, the same whenever a line is exported.
///
/// The file's identity and the line's beginning, which has its time, go in as hashes with the device's
/// secret, so that nobody finds what was left out of a record by trying. The check tells a line from one that
/// stood at its place before a power cut took it back.
class RecordIdentifiers {
public:
    /// The file's identity is as `FileProgress` has it.
    RecordIdentifiers(std::string_view device, std::string_view sink, std::string_view fileIdentity,
                      std::string_view secret);

    [[nodiscard]] std::string of(std::uint64_t offset, std::string_view line) const;

private:
    std::string key_;
    std::string prefix_;
};

} // namespace tamblo::tools
