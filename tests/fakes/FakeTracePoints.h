#pragma once

#include "platform/TracePoints.h"

#include <cstdint>
#include <mutex>
#include <utility>
#include <vector>

namespace tamblo {

/// Keeps every trace code.
class FakeTracePoints final : public TracePoints {
public:
    void EmitTracePoint(std::uint32_t traceCode) noexcept override {
        const std::lock_guard held(mutex_);
        codes_.push_back(traceCode);
    }
    /// The codes since the last call.
    [[nodiscard]] std::vector<std::uint32_t> take() {
        const std::lock_guard held(mutex_);
        return std::exchange(codes_, {});
    }

private:
    std::mutex mutex_;
    std::vector<std::uint32_t> codes_;
};

} // namespace tamblo
