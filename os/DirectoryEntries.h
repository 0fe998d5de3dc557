#pragma once

#include <cstddef>
#include <string>
#include <vector>

namespace tamblo {

/// The names of a directory's entries at this moment, without "." and ".." and in no order, or why they
/// cannot be had.
struct DirectoryEntries {
    /// Of more than `most` entries, any so many.
    [[nodiscard]] static DirectoryEntries read(const std::string& path, std::size_t most);

    int error = 0; ///< 0 or an `errno`
    bool isCut = false;
    std::vector<std::string> names = {};
};

} // namespace tamblo
