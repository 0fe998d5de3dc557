#include "platform/linux/status/CounterFile.h"

#include "base/Format.h"
#include "os/SmallFile.h"
#include "platform/CounterFileLayout.h"

#include <algorithm>
#include <array>
#include <cerrno>
#include <chrono>
#include <cstring>
#include <new>
#include <system_error>

#include <fcntl.h>
#include <sys/mman.h>
#include <sys/stat.h>

namespace tamblo {

namespace {

constexpr const char* kBootIdentifier = "/proc/sys/kernel/random/boot_id";

struct File {
    counters::FileHeader header;
    std::array<counters::Slot, counters::kSlots> slots;
};

std::array<char, 40> bootIdentifier() {
    std::array<char, 40> identifier{};
    const SmallFile file = SmallFile::read(kBootIdentifier, 64);
    file.trimmed().copy(identifier.data(), identifier.size());
    return identifier;
}

std::uint64_t nanosecondsNow() {
    const auto now = std::chrono::system_clock::now().time_since_epoch();
    return static_cast<std::uint64_t>(std::chrono::nanoseconds(now).count());
}

/// The file with room for all, on a file system that has it: a page that cannot be had would end the process.
FileDescriptor openFile(const std::string& path) {
    FileDescriptor file(::open(path.c_str(), O_RDWR | O_CREAT | O_CLOEXEC | O_NOFOLLOW | O_NONBLOCK, 0600));
    struct stat status {};
    if (!file.isOpen() || ::fstat(file.get(), &status) != 0) {
        return {};
    }
    if (!S_ISREG(status.st_mode)) {
        errno = EINVAL;
        return {};
    }
    if (::ftruncate(file.get(), sizeof(File)) != 0) {
        return {};
    }
    errno = ::posix_fallocate(file.get(), 0, sizeof(File));
    return errno == 0 ? std::move(file) : FileDescriptor();
}

} // namespace

void CounterFile::open(const std::string& runtimeDirectory, StructuredLog& log) {
    began_ = nanosecondsNow();
    const std::string path = formatted("{}/{}", runtimeDirectory, counters::kFileName);
    const FileDescriptor descriptor = openFile(path);
    void* const place = descriptor.isOpen() ? ::mmap(nullptr, sizeof(File), PROT_READ | PROT_WRITE,
                                                     MAP_SHARED, descriptor.get(), 0)
                                            : MAP_FAILED;
    if (place == MAP_FAILED) {
        log.report(LogLevel::error, "zrrs",
                   formatted("{}: {}; the counters of status and metrics end with the service", path,
                             std::generic_category().message(errno)));
        return;
    }
    counters::FileHeader wanted{.layout = counters::layoutHash(), .began = began_, .boot = bootIdentifier()};
    counters::kFileMagic.copy(wanted.magic.data(), wanted.magic.size());
    File& file = *static_cast<File*>(place);
    const bool isContinued = file.header.magic == wanted.magic && file.header.layout == wanted.layout &&
                             file.header.boot == wanted.boot;
    if (!isContinued) {
        std::memset(place, 0, sizeof(File));
        file.header = wanted;
    }
    began_ = file.header.began;
    counters::keepIn(file.slots.data());
}

} // namespace tamblo
