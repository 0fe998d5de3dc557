#pragma once

#include "base/Dictionary.h"
#include "platform/StructuredLog.h"

#include <optional>
#include <string>

namespace tamblo {

/// A file that holds one JSON object, written by somebody else: an operator, a test, another program.
///
/// A missing file is no object and no error. One that cannot be read, is not JSON or no object is one error
/// line for each state of the file that is met, naming the file and the place. Not thread-safe; reading may
/// block on the disk.
class JsonFile {
public:
    /// Larger files are refused, unread.
    static constexpr std::size_t kMaximumSize = 4U << 20U;

    explicit JsonFile(std::string path) : path_(std::move(path)) {}

    [[nodiscard]] std::optional<Dictionary> read(StructuredLog& log);
    [[nodiscard]] const std::string& path() const noexcept { return path_; }

private:
    void report(StructuredLog& log, std::string state, std::string_view fault);

    std::string path_;
    /// The state of the file and its fault as reported last.
    std::string reported_;
};

} // namespace tamblo
