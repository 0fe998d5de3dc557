#pragma once

#include <cstdint>

namespace tamblo {

/// The kernel's trace facility. Any thread; does nothing where there is none.
class TracePoints {
public:
    virtual ~TracePoints() = default;
    virtual void EmitTracePoint(std::uint32_t traceCode) noexcept = 0;
};

} // namespace tamblo
