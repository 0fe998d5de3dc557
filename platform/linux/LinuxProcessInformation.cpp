#include "platform/linux/LinuxProcessInformation.h"

#include "base/Format.h"
#include "base/Utf8.h"
#include "platform/linux/SmallFile.h"

#include <algorithm>
#include <cerrno>
#include <charconv>
#include <cstdlib>
#include <ctime>
#include <string_view>
#include <system_error>
#include <utility>

#include <unistd.h>

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
    while (last > 0 && isUtf8Continuation(name[last])) {
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

/// The bytes of a line such as "RssAnon:      1234 kB"; nothing without that line.
std::optional<std::uint64_t> bytesOfField(std::string_view status, std::string_view name) {
    const std::size_t at = status.find(formatted("\n{}:", name));
    if (at == std::string_view::npos) {
        return std::nullopt;
    }
    status.remove_prefix(at + name.size() + 2);
    status.remove_prefix(std::min(status.find_first_not_of(" \t"), status.size()));
    std::uint64_t kibibytes = 0;
    const auto result = std::from_chars(status.data(), status.data() + status.size(), kibibytes);
    return result.ec == std::errc() ? std::optional(kibibytes * 1024) : std::nullopt;
}

ProcessInformation::QueryError queryError(int code) {
    return {code, std::generic_category().message(code)};
}

std::variant<std::uint64_t, ProcessInformation::QueryError> readFootprint(const std::string& path) {
    constexpr std::size_t kMaximumStatus = 64UL * 1024;
    const SmallFile file = SmallFile::read(path, kMaximumStatus);
    if (file.error != 0) {
        return queryError(file.error);
    }
    const auto anonymous = bytesOfField(file.text, "RssAnon");
    if (!anonymous) {
        return queryError(ENODATA);
    }
    return *anonymous + bytesOfField(file.text, "RssShmem").value_or(0) +
           bytesOfField(file.text, "VmSwap").value_or(0);
}

} // namespace

LinuxProcessInformation::LinuxProcessInformation(std::string root, SteadyNow now)
    : root_(std::move(root)), footprint_(kValidity, std::move(now)) {}

pid_t LinuxProcessInformation::ownProcessIdentifier() const noexcept {
    return ::getpid();
}

std::optional<std::string> LinuxProcessInformation::ProcessNameForPid(pid_t pid) const {
    if (pid <= 0) {
        return std::nullopt;
    }
    constexpr std::size_t kMaximumName = 64;
    std::string name = SmallFile::read(formatted("{}/{}/comm", root_, pid), kMaximumName).text;
    if (name.empty()) {
        return std::nullopt;
    }
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
    return footprint_.get([this] { return readFootprint(root_ + "/self/status"); });
}

std::array<double, 3> LinuxProcessInformation::loadAverages() const {
    std::array<double, 3> loads{};
    return ::getloadavg(loads.data(), 3) == 3 ? loads : std::array<double, 3>{};
}

} // namespace tamblo
