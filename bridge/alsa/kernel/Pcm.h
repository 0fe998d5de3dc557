#pragma once

#include <chrono>
#include <compare>
#include <cstdint>
#include <optional>
#include <string>
#include <string_view>

#include <sys/types.h>

namespace tamblo::alsa {

/// A place of a card where one process at a time plays or records.
struct PcmName {
    unsigned card = 0;
    unsigned device = 0;
    bool isInput = false;
    unsigned substream = 0;

    auto operator<=>(const PcmName&) const = default;
    [[nodiscard]] bool isOfSameDevice(const PcmName& other) const noexcept {
        return card == other.card && device == other.device && isInput == other.isInput;
    }
};

/// A device by its node's name, such as "pcmC0D3p", as its first substream; nothing for another node.
[[nodiscard]] std::optional<PcmName> deviceOfNode(std::string_view node) noexcept;

enum class PcmState : std::uint8_t {
    closed,
    idle, ///< open, and nothing runs: set up, prepared, paused or suspended
    running,
    draining, ///< what is left is played to the end
    xrun,     ///< it stopped by itself: nothing to play, or no room for what was recorded
};

/// What the kernel says of a PCM at a moment.
struct PcmStatus {
    PcmState state = PcmState::closed;
    pid_t owner = 0; ///< the thread that opened it; 0 for one of another PID namespace
    /// When it was last started or stopped, and when this was written, by a clock that the owner has chosen;
    /// 0 when the kernel did not say.
    std::chrono::nanoseconds trigger{0};
    std::chrono::nanoseconds written{0};
    std::uint64_t mostAvailable = 0; ///< frames, since somebody last asked
    std::uint64_t position = 0;      ///< frames, since it was prepared

    [[nodiscard]] bool isRunning() const noexcept {
        return state == PcmState::running || state == PcmState::draining;
    }
};

/// Of a PCM that is set up; zeros for what was not said, or makes no sense.
struct PcmFormat {
    std::string sample; ///< such as "S16_LE"
    std::uint32_t channels = 0;
    std::uint32_t rate = 0;
    std::uint32_t periodFrames = 0;
    std::uint32_t bufferFrames = 0;

    bool operator==(const PcmFormat&) const = default;
};

/// The edge to the kernel's texts. Nothing for one that is torn or none of its own.
[[nodiscard]] std::optional<PcmStatus> parseStatus(std::string_view text);
[[nodiscard]] std::optional<PcmFormat> parseFormat(std::string_view text);

} // namespace tamblo::alsa
