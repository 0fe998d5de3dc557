#pragma once

#include "bridge/alsa/kernel/Pcm.h"
#include "bridge/common/Reporter.h"
#include "bridge/common/SessionPool.h"
#include "bridge/common/Time.h"

#include <chrono>
#include <cstdint>
#include <map>
#include <optional>
#include <string>

namespace tamblo::alsa {

/// What went wrong with a PCM between two looks at it.
struct XrunCount {
    std::uint32_t xruns = 0;
    std::uint32_t restarts = 0; ///< it ran at both looks, and was prepared and started in between
};

/// What two looks at a PCM that the same process has had open all the time tell. An xrun that the process
/// has recovered from in between looks like a restart; one that does not stop the PCM, as its owner wants it
/// so, shows in how much was available at most. Several between two looks count as one.
[[nodiscard]] XrunCount xrunsBetween(const PcmStatus& before, const PcmStatus& now, const PcmFormat& format);

/// Reports xruns as overloads of the session: at most one message a second for each PCM, with their number
/// since the last one. When a PCM had none for a while, the first is also an error of the audio I/O, which
/// can have the service capture what goes on.
///
/// The loop's thread.
class Xruns final : public bridge::Timed {
public:
    static constexpr std::chrono::seconds kInterval{1};
    static constexpr std::chrono::seconds kCalm{10};

    Xruns(bridge::Reporter& reporter, const bridge::Clock& clock, const bridge::SessionPool& sessions)
        : reporter_(reporter), clock_(clock), sessions_(sessions) {}

    /// Whose they are, and on what.
    struct Place {
        bridge::SessionPool::Key session = 0;
        std::string application;
        std::string device;
    };
    void count(const PcmName& pcm, const Place& place, const XrunCount& count, double secondsLost,
               const PcmFormat& format, std::uint64_t position);

    [[nodiscard]] std::optional<bridge::SteadyTime> due() const override { return due_; }
    void run() override;

private:
    struct Tally {
        Place place;
        PcmFormat format;
        std::uint64_t position = 0;
        XrunCount number; ///< since it was last spoken of
        double secondsLost = 0;
        std::optional<bridge::SteadyTime> saidAt;

        [[nodiscard]] bool hasNews() const noexcept { return number.xruns + number.restarts != 0; }
    };

    void report(Tally& tally, const bridge::Moment& now);

    bridge::Reporter& reporter_;
    const bridge::Clock& clock_;
    const bridge::SessionPool& sessions_;
    std::map<PcmName, Tally> tallies_;
    std::optional<bridge::SteadyTime> due_;
    std::int64_t issues_ = 0;
};

} // namespace tamblo::alsa
