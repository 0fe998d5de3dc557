#pragma once

#include "os/FileDescriptor.h"

#include <cstddef>
#include <optional>
#include <string>
#include <string_view>

namespace tamblo {

/// A file whose content counts for as long as the process that wrote it lives: what is so at the moment. The
/// writer holds the advisory lock of the file (`flock`), which ends with it however it ends. One writer for a
/// path; readers are any processes.
class HeldFile {
public:
    explicit HeldFile(std::string path) : path_(std::move(path)) {}
    ~HeldFile() { remove(); }
    HeldFile(const HeldFile&) = delete;
    HeldFile& operator=(const HeldFile&) = delete;

    /// Puts this content in the file's place, in one step. Returns 0 or an `errno`, after which the old
    /// content stands. The directory has to be there.
    [[nodiscard]] int write(std::string_view content);
    /// Nothing counts any more.
    void remove() noexcept;

    /// What counts now: nothing when there is no file, or one whose writer has gone, or more than `limit`
    /// bytes. Any thread; waits for nobody.
    [[nodiscard]] static std::optional<std::string> read(const std::string& path, std::size_t limit);

private:
    const std::string path_;
    FileDescriptor held_;
};

} // namespace tamblo
