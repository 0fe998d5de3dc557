#include "platform/linux/device/LinuxProcessInformation.h"

#include <cerrno>
#include <cstdlib>
#include <ctime>
#include <system_error>
#include <utility>

#include <malloc.h>

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

std::variant<std::uint64_t, ProcessInformation::QueryError> readFootprint(const ProcessFiles& files) {
    const auto own = files.ownMemory();
    if (const int* const error = std::get_if<int>(&own)) {
        return queryError(*error);
    }
    const auto& memory = std::get<ProcessFiles::Memory>(own);
    if (!memory.anonymous) {
        return queryError(ENODATA);
    }
    return *memory.anonymous + memory.shared + memory.swapped;
}

} // namespace

LinuxProcessInformation::LinuxProcessInformation(std::string root, SteadyNow now)
    : files_(std::move(root)), footprint_(kValidity, std::move(now)) {}

std::chrono::duration<double> LinuxProcessInformation::systemUptime() const noexcept {
    return readClock(CLOCK_BOOTTIME);
}

std::chrono::microseconds LinuxProcessInformation::processorTime() const noexcept {
    return std::chrono::duration_cast<std::chrono::microseconds>(readClock(CLOCK_PROCESS_CPUTIME_ID));
}

std::variant<std::uint64_t, ProcessInformation::QueryError>
LinuxProcessInformation::physicalFootprint() const {
    return footprint_.get([this] { return readFootprint(files_); });
}

std::array<double, 3> LinuxProcessInformation::loadAverages() const {
    std::array<double, 3> loads{};
    return ::getloadavg(loads.data(), 3) == 3 ? loads : std::array<double, 3>{};
}

void LinuxProcessInformation::giveBackMemory() const noexcept {
    // The allocator keeps what lies below a block that is in use, and that may be nearly all.
    static_cast<void>(::malloc_trim(0));
}

} // namespace tamblo
