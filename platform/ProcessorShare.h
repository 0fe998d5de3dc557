#pragma once

#include <chrono>
#include <cstdint>

namespace tamblo {

/// How much of the time that pieces of work take is the processor's, and not spent on waiting for a disk or
/// for other programs to have had their turn.
///
/// To ask the system for a thread's processor time costs up to a microsecond, so only a sample of the pieces
/// is measured so; what these show is taken to be true of those in between. One thread at a time.
class ProcessorShare {
public:
    using Time = std::chrono::nanoseconds;

    /// Whether the next piece is to be measured on the clock of the thread's processor time, too.
    [[nodiscard]] bool wantsSample() const noexcept { return sinceSample_ >= kBetweenSamples; }
    void addSample(Time processor, Time taken) noexcept {
        sinceSample_ = Time{0};
        // What was measured before fades, so that the share follows the load.
        sampledProcessor_ = sampledProcessor_ / 2 + processor.count();
        sampledTaken_ = sampledTaken_ / 2 + taken.count();
        const std::int64_t share =
            sampledTaken_ > 0 ? sampledProcessor_ * kWhole / sampledTaken_ : std::int64_t{kWhole};
        share_ = share < kWhole ? share : kWhole;
    }
    /// Takes a piece into account; the processor time of it, as far as is known.
    [[nodiscard]] Time of(Time taken) noexcept {
        sinceSample_ += taken;
        return Time(taken.count() * share_ / kWhole);
    }

private:
    static constexpr std::chrono::milliseconds kBetweenSamples{2};
    static constexpr std::int64_t kWhole = 1024;

    Time sinceSample_{0};
    std::int64_t sampledProcessor_ = 0;
    std::int64_t sampledTaken_ = 0;
    std::int64_t share_ = kWhole;
};

} // namespace tamblo
