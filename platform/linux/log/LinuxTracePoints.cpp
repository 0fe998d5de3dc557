#include "platform/linux/log/LinuxTracePoints.h"

#include "platform/Counters.h"

#include <array>
#include <cstring>
#include <ctime>
#include <string_view>

#include <fcntl.h>

namespace tamblo {

namespace {

constexpr const char* kMarkerFiles[] = {"/sys/kernel/tracing/trace_marker",
                                        "/sys/kernel/debug/tracing/trace_marker"};
/// How long no mark is tried after one was refused.
constexpr std::int64_t kPauseSeconds = 1;

std::int64_t coarseSeconds() noexcept {
    timespec time{};
    ::clock_gettime(CLOCK_MONOTONIC_COARSE, &time);
    return time.tv_sec;
}

} // namespace

LinuxTracePoints::LinuxTracePoints() : LinuxTracePoints(kMarkerFiles) {}

LinuxTracePoints::LinuxTracePoints(std::span<const char* const> markerFiles) {
    for (const char* path : markerFiles) {
        marker_ = FileDescriptor(::open(path, O_WRONLY | O_CLOEXEC | O_NONBLOCK | O_NOCTTY));
        if (marker_.isOpen()) {
            return;
        }
    }
}

void LinuxTracePoints::EmitTracePoint(std::uint32_t traceCode) noexcept {
    if (!marker_.isOpen()) {
        return;
    }
    const std::int64_t pausedUntil = pausedUntil_.load(std::memory_order_relaxed);
    if (pausedUntil != 0 && coarseSeconds() < pausedUntil) {
        counters::add(counters::Counter::tracePoints);
        return;
    }
    constexpr std::string_view kDigits = "0123456789abcdef";
    std::array<char, 18> line;
    std::memcpy(line.data(), "tamblo 0x", 9);
    for (unsigned digit = 0; digit < 8; ++digit) {
        line[9 + digit] = kDigits[traceCode >> (28 - 4 * digit) & 0xFU];
    }
    line[17] = '\n';
    const bool accepted = ::write(marker_.get(), line.data(), line.size()) >= 0;
    if (!accepted) {
        counters::add(counters::Counter::tracePoints);
        // One second more, since the clock counts whole ones.
        pausedUntil_.store(coarseSeconds() + kPauseSeconds + 1, std::memory_order_relaxed);
    } else if (pausedUntil != 0) {
        pausedUntil_.store(0, std::memory_order_relaxed);
    }
}

} // namespace tamblo
