#pragma once

#include <cstddef>
#include <string>
#include <string_view>

namespace tamblo {

/// What a small regular file holds at this moment, or why it cannot be had.
struct SmallFile {
    /// Whether a symbolic link in the file's place leads to another file or is an error (`ELOOP`).
    enum class Links { followed, refused };

    /// 0 or an `errno`: `EFBIG` for a file with more than `limit` bytes, of which no more is read; `EISDIR`
    /// or `EINVAL` for what is no regular file. Never waits for another process, as a pipe would.
    [[nodiscard]] static SmallFile read(const std::string& path, std::size_t limit,
                                        Links links = Links::followed);

    /// Without the white space at both ends.
    [[nodiscard]] std::string_view trimmed() const noexcept;

    int error = 0;
    std::string text = {}; ///< empty after an error
};

} // namespace tamblo
