#include "Storage.h"

#include <cstdint>
#include <cstdlib>

#include <linux/magic.h>
#include <sys/statfs.h>
#include <unistd.h>

namespace tamblo::bench {

namespace {

/// The sinks' files of one service, five of each sink.
constexpr std::uint64_t kMemoryNeeded = std::uint64_t{1} << 30U;

bool isInMemory(const struct statfs& status) noexcept {
    return status.f_type == TMPFS_MAGIC || status.f_type == RAMFS_MAGIC;
}

bool isUsable(const char* directory, struct statfs& status) noexcept {
    return directory != nullptr && ::statfs(directory, &status) == 0 && ::access(directory, W_OK | X_OK) == 0;
}

StoragePlace findMemory() {
    constexpr const char* kDirectory = "/dev/shm";
    struct statfs status {};
    if (!isUsable(kDirectory, status) || !isInMemory(status)) {
        return {Storage::tmpfs, "", "/dev/shm is not a tmpfs that can be written"};
    }
    if (status.f_bavail * static_cast<std::uint64_t>(status.f_bsize) < kMemoryNeeded) {
        return {Storage::tmpfs, "", "/dev/shm has less than 1 GiB left"};
    }
    return {Storage::tmpfs, kDirectory, ""};
}

StoragePlace findDisk() {
    for (const char* directory :
         {static_cast<const char*>(std::getenv("TMPDIR")), "/var/tmp", "/tmp", BENCH_DIRECTORY}) {
        struct statfs status {};
        if (isUsable(directory, status) && !isInMemory(status)) {
            return {Storage::disk, directory, ""};
        }
    }
    return {Storage::disk, "", "neither TMPDIR, /var/tmp, /tmp nor the build tree is on a disk"};
}

} // namespace

std::string_view describe(Storage storage) noexcept {
    return storage == Storage::tmpfs ? "tmpfs" : "disk";
}

StoragePlace findStorage(Storage storage) {
    return storage == Storage::tmpfs ? findMemory() : findDisk();
}

} // namespace tamblo::bench
