#pragma once

#include <string>
#include <string_view>

namespace tamblo::bench {

/// What the service's directories lie on: memory, which leaves the disk out of the figures, or a disk, as
/// they do on a device.
enum class Storage { tmpfs, disk };
[[nodiscard]] std::string_view describe(Storage storage) noexcept;

/// Where a service's directories are made.
struct StoragePlace {
    Storage storage{};
    std::string directory;      ///< empty: there is none
    std::string whyThereIsNone; ///< for people
};

/// `/dev/shm` if that is memory and has room for what a scenario writes, or the first of TMPDIR, /var/tmp,
/// /tmp and the build tree that is not in memory.
[[nodiscard]] StoragePlace findStorage(Storage storage);

} // namespace tamblo::bench
