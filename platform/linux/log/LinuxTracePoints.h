#pragma once

#include "os/FileDescriptor.h"
#include "platform/TracePoints.h"

#include <atomic>
#include <cstdint>
#include <span>

namespace tamblo {

/// Trace points as lines of the kernel's trace marker: `tamblo 0x21044838`.
///
/// The marker is opened once, at the start; where that is not allowed a trace point costs one comparison.
/// While tracing is switched off the kernel refuses marks: then none is tried for a second, so that an idle
/// tracer costs no system call per message.
class LinuxTracePoints final : public TracePoints {
public:
    /// Takes the marker of the kernel's own trace file system.
    LinuxTracePoints();
    /// Takes the first of the files that can be opened for writing.
    explicit LinuxTracePoints(std::span<const char* const> markerFiles);

    void EmitTracePoint(std::uint32_t traceCode) noexcept override;

private:
    FileDescriptor marker_;
    /// On the coarse monotonic clock, in seconds; 0 while marks are accepted.
    std::atomic<std::int64_t> pausedUntil_{0};
};

} // namespace tamblo
