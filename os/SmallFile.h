#pragma once

#include "base/SplitText.h"
#include "os/FileState.h"

#include <cerrno>
#include <cstddef>
#include <string>
#include <string_view>

namespace tamblo {

/// What a small file holds at this moment, or why it cannot be had.
struct SmallFile {
    /// Whether a symbolic link in the file's place leads to another file or is an error (`ELOOP`).
    enum class Links { followed, refused };

    /// For regular files. `error` is 0 or an `errno`: `EFBIG` for a file with more than `limit` bytes, of
    /// which no more is read; `EISDIR` or `EINVAL` for what is no regular file. Never waits for another
    /// process, as a pipe would.
    [[nodiscard]] static SmallFile read(const std::string& path, std::size_t limit,
                                        Links links = Links::followed);
    /// What comes from a descriptor of any kind until its end, for which this may wait.
    [[nodiscard]] static SmallFile read(int descriptor, std::size_t limit, std::size_t expected = 0);

    [[nodiscard]] bool isMissing() const noexcept { return error == ENOENT || error == ENOTDIR; }
    /// The error in words.
    [[nodiscard]] std::string reason() const;
    /// Without the white space at both ends.
    [[nodiscard]] std::string_view trimmed() const noexcept { return tamblo::trimmed(text); }

    int error = 0;
    std::string text = {};   ///< empty after an error
    FileState state = {};    ///< just before it was read; that of no file when it could not be opened
    bool isStateOld = false; ///< so that the state stands for this content for certain
};

} // namespace tamblo
