#include "platform/linux/LinuxProcessInformation.h"

#include "platform/linux/SmallFile.h"

#include <cerrno>
#include <cstdlib>
#include <ctime>
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

ProcessInformation::QueryError queryError(int code) {
    return {code, std::generic_category().message(code)};
}

std::variant<std::uint64_t, ProcessInformation::QueryError> readFootprint(const std::string& path) {
    constexpr std::size_t kMaximumStatus = 64UL * 1024;
    const SmallFile file = SmallFile::read(path, kMaximumStatus);
    if (file.error != 0) {
        return queryError(file.error);
    }
    const auto anonymous = ProcessFiles::bytesOfField(file.text, "RssAnon");
    if (!anonymous) {
        return queryError(ENODATA);
    }
    return *anonymous + ProcessFiles::bytesOfField(file.text, "RssShmem").value_or(0) +
           ProcessFiles::bytesOfField(file.text, "VmSwap").value_or(0);
}

} // namespace

LinuxProcessInformation::LinuxProcessInformation(std::string root, SteadyNow now)
    : root_(std::move(root)), files_(root_), footprint_(kValidity, std::move(now)) {}

pid_t LinuxProcessInformation::ownProcessIdentifier() const noexcept {
    return ::getpid();
}

std::optional<std::string> LinuxProcessInformation::ProcessNameForPid(pid_t pid) const {
    return files_.name(pid);
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
