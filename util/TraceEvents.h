#pragma once

#include "util/Context.h"

#include <cstdint>

namespace tamblo {

/// What the service marks in the kernel's trace.
enum class TraceEvent : std::uint32_t {
    createReportingSession = 0x1205,
    startReportingSession = 0x1206,
    stopReportingSession = 0x1207,
    destroyReportingSession = 0x1208,
    sendMessageRequest = 0x1209,
    sessionCreated = 0x120A,
    sessionStarted = 0x120B,
    sessionStopped = 0x120C,
    sessionDestroyed = 0x120D,
    sessionMessage = 0x120E,
};

/// Class 0x21 in the top byte, subclass 0x04 below it, then the event number in bits 2 to 15.
[[nodiscard]] constexpr std::uint32_t traceCode(TraceEvent event) noexcept {
    return 0x21040000U | static_cast<std::uint32_t>(event) << 2U;
}

inline void emitTracePoint(const Context& context, TraceEvent event) noexcept {
    context.platform().tracePoints->EmitTracePoint(traceCode(event));
}

} // namespace tamblo
