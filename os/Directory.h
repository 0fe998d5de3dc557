#pragma once

#include "os/FileDescriptor.h"

#include <chrono>
#include <cstddef>
#include <cstdint>
#include <optional>
#include <string>
#include <vector>

namespace tamblo {

/// Makes a directory and those on the way to it, for their owner alone, whatever the process's mask is; what
/// is there stays as it is. Returns 0 or an `errno`.
[[nodiscard]] int makeDirectories(const std::string& path);

/// Takes a directory's advisory lock (`flock`), waiting for whoever has it, at most so long if that is said:
/// it lasts as long as the descriptor. Not open, with the reason in `errno`, when it cannot be had;
/// `EWOULDBLOCK` when the wait was too long. A wait without limit is the fairer one: the kernel has those who
/// wait take turns.
[[nodiscard]] FileDescriptor lockDirectory(const std::string& path,
                                           std::optional<std::chrono::milliseconds> patience = {});

/// The names of a directory's entries at this moment, without "." and ".." and in no order, or why they
/// cannot be had.
struct DirectoryEntries {
    /// Of more than `most` entries, any so many.
    [[nodiscard]] static DirectoryEntries read(const std::string& path, std::size_t most);
    [[nodiscard]] static DirectoryEntries read(int descriptor, std::size_t most);

    int error = 0; ///< 0 or an `errno`
    bool isCut = false;
    std::vector<std::string> names = {};
};

/// Removes an entry of a directory and, where that is a directory, all that is in it; no symbolic link is
/// followed. Returns 0 or an `errno`, after which some of it may be gone. No entry is no error.
[[nodiscard]] int removeTree(int directory, const std::string& name);
/// The bytes of all regular files in a directory's entry, at whatever depth. `entries` is how many of them
/// are looked at, and what is left of that.
[[nodiscard]] std::uint64_t sizeOfTree(int directory, const std::string& name, std::size_t& entries);

} // namespace tamblo
