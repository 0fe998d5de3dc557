#pragma once

#include "base/Dictionary.h"
#include "base/JsonReader.h"
#include "os/FileState.h"
#include "platform/StructuredLog.h"
#include "platform/linux/settings/ToldOnce.h"

#include <cstddef>
#include <functional>
#include <optional>
#include <string>
#include <string_view>
#include <utility>

namespace tamblo {

/// A file that holds one JSON object or array, written by somebody else: an operator, a test, another
/// program.
///
/// A missing file is no value and no error. One that cannot be read, is not JSON or holds another kind of
/// value is one error line for each state of the file that is met, naming the file and the place. What keeps
/// it from being read may pass without the file's doing (no descriptor is left, the disk fails): whoever has
/// an earlier value keeps it then. Not thread-safe; reading may block on the disk.
class JsonFile {
public:
    /// Larger files are refused, unread.
    static constexpr std::size_t kMaximumSize = 4U << 20U;

    explicit JsonFile(std::string path, std::size_t maximumSize = kMaximumSize)
        : path_(std::move(path)), maximumSize_(maximumSize) {}

    [[nodiscard]] std::optional<Dictionary> read(StructuredLog& log);
    /// Reads a file that holds an array, element by element; null ones are skipped. Nothing of what was taken
    /// counts unless the whole file was read: false otherwise.
    [[nodiscard]] bool readArray(const std::function<void(const JsonItem&)>& take, StructuredLog& log);
    /// Whether the last reading failed although something was there to be read: what it holds is not known.
    [[nodiscard]] bool isUnreadable() const noexcept { return isUnreadable_; }
    /// The file's state as it was just before it was read last; that of no file when there was none.
    [[nodiscard]] const FileState& state() const noexcept { return state_; }
    /// Whether what was read last is certain to be the content of a file of this state, or of the file as it
    /// is now.
    [[nodiscard]] bool isCurrent(const FileState& state) const noexcept {
        return isCertain_ && state == state_;
    }
    [[nodiscard]] bool isCurrent() const noexcept;
    [[nodiscard]] const std::string& path() const noexcept { return path_; }

private:
    static constexpr std::string_view kNotUsed = "nothing of it is used";

    [[nodiscard]] std::optional<std::string> readText(StructuredLog& log);
    /// An empty fault is none.
    void report(StructuredLog& log, std::string_view fault, std::string_view consequence = kNotUsed);
    void report(StructuredLog& log, const JsonError& error);

    std::string path_;
    std::size_t maximumSize_;
    FileState state_;
    bool isCertain_ = false;
    bool isUnreadable_ = false;
    ToldOnce told_;
};

} // namespace tamblo
