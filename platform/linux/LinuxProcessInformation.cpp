#include "platform/linux/LinuxProcessInformation.h"

#include "base/Format.h"
#include "base/Utf8.h"
#include "platform/linux/FileDescriptor.h"

#include <array>
#include <cerrno>
#include <cstdlib>
#include <ctime>

#include <fcntl.h>

namespace tamblo {

namespace {

std::chrono::nanoseconds readClock(clockid_t clock) noexcept {
    timespec time{};
    ::clock_gettime(clock, &time);
    return std::chrono::seconds(time.tv_sec) + std::chrono::nanoseconds(time.tv_nsec);
}

/// The kernel cuts names at 15 bytes, through the middle of a character if need be, and takes any bytes for a
/// name.
std::string asUtf8(std::string name) {
    if (isUtf8(name)) {
        return name;
    }
    std::size_t last = name.size() - 1;
    while (last > 0 && (static_cast<unsigned char>(name[last]) & 0xC0U) == 0x80U) {
        --last;
    }
    if (static_cast<unsigned char>(name[last]) >= 0xC0 && isUtf8(std::string_view(name).substr(0, last))) {
        name.resize(last);
        return name;
    }
    for (char& character : name) {
        if (static_cast<unsigned char>(character) >= 0x80) {
            character = '?';
        }
    }
    return name;
}

} // namespace

pid_t LinuxProcessInformation::ownProcessIdentifier() const noexcept {
    return ::getpid();
}

std::optional<std::string> LinuxProcessInformation::ProcessNameForPid(pid_t pid) const {
    if (pid <= 0) {
        return std::nullopt;
    }
    const FileDescriptor file(::open(formatted("/proc/{}/comm", pid).c_str(), O_RDONLY | O_CLOEXEC));
    std::array<char, 64> bytes;
    const ssize_t count = file.isOpen() ? ::read(file.get(), bytes.data(), bytes.size()) : 0;
    if (count <= 0) {
        return std::nullopt;
    }
    std::string name(bytes.data(), static_cast<std::size_t>(count));
    if (name.back() == '\n') {
        name.pop_back();
    }
    return asUtf8(std::move(name));
}

std::chrono::duration<double> LinuxProcessInformation::systemUptime() const noexcept {
    return readClock(CLOCK_BOOTTIME);
}

std::chrono::microseconds LinuxProcessInformation::processorTime() const noexcept {
    return std::chrono::duration_cast<std::chrono::microseconds>(readClock(CLOCK_PROCESS_CPUTIME_ID));
}

std::variant<std::uint64_t, ProcessInformation::QueryError>
LinuxProcessInformation::physicalFootprint() const {
    return QueryError{ENOSYS, "not implemented"};
}

std::array<double, 3> LinuxProcessInformation::loadAverages() const {
    std::array<double, 3> loads{};
    (void)::getloadavg(loads.data(), 3);
    return loads;
}

} // namespace tamblo
