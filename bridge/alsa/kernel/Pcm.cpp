#include "bridge/alsa/kernel/Pcm.h"

#include "base/SplitText.h"
#include "bridge/common/CleanText.h"

#include <algorithm>
#include <array>
#include <utility>

namespace tamblo::alsa {

namespace {

constexpr std::array<std::pair<std::string_view, PcmState>, 9> kStates{{
    {"OPEN", PcmState::idle},
    {"SETUP", PcmState::idle},
    {"PREPARED", PcmState::idle},
    {"RUNNING", PcmState::running},
    {"XRUN", PcmState::xrun},
    {"DRAINING", PcmState::draining},
    {"PAUSED", PcmState::idle},
    {"SUSPENDED", PcmState::idle},
    {"DISCONNECTED", PcmState::idle},
}};
/// More than any device has; what is above is a mistake of the text.
constexpr std::uint32_t kMostChannels = 1024;
constexpr std::uint32_t kMostRate = 10'000'000;
constexpr std::uint32_t kMostFrames = 1U << 30U;
constexpr std::size_t kMostSampleNameBytes = 32;

template <typename Number>
std::optional<Number> numberOf(std::string_view text, std::string_view name) noexcept {
    std::optional<std::string_view> value = fieldOf(text, name);
    return value ? takeNumber<Number>(*value) : std::nullopt;
}

std::uint32_t boundedNumber(std::string_view text, std::string_view name, std::uint32_t most) noexcept {
    const auto number = numberOf<std::uint32_t>(text, name);
    return number && *number <= most ? *number : 0;
}

/// "12.000345678" seconds; 0 for what is no time.
std::chrono::nanoseconds timeOf(std::string_view text, std::string_view name) noexcept {
    constexpr std::int64_t mostSeconds = 1LL << 33;
    constexpr std::size_t digits = 9;
    std::string_view value = fieldOf(text, name).value_or("");
    const auto seconds = takeNumber<std::int64_t>(value);
    if (!seconds || *seconds < 0 || *seconds > mostSeconds || value.size() != 1 + digits ||
        !takeUpTo('.', value).empty()) {
        return {};
    }
    const auto fraction = takeNumber<std::uint32_t>(value);
    return fraction && value.empty() ? std::chrono::seconds(*seconds) + std::chrono::nanoseconds(*fraction)
                                     : std::chrono::nanoseconds{};
}

} // namespace

std::optional<PcmName> deviceOfNode(std::string_view node) noexcept {
    constexpr std::string_view prefix = "pcmC";
    if (!node.starts_with(prefix)) {
        return std::nullopt;
    }
    node.remove_prefix(prefix.size());
    const auto card = takeNumber<unsigned>(node);
    if (!card || !node.starts_with('D')) {
        return std::nullopt;
    }
    node.remove_prefix(1);
    const auto device = takeNumber<unsigned>(node);
    if (!device || (node != "p" && node != "c")) {
        return std::nullopt;
    }
    return PcmName{.card = *card, .device = *device, .isInput = node == "c"};
}

std::optional<PcmStatus> parseStatus(std::string_view text) {
    if (trimmed(text) == "closed") {
        return PcmStatus{};
    }
    const std::string_view word = fieldOf(text, "state").value_or("");
    const auto state =
        std::find_if(kStates.begin(), kStates.end(), [word](const auto& row) { return row.first == word; });
    const auto owner = numberOf<pid_t>(text, "owner_pid");
    // The last line: without it the rest is not complete.
    const auto isWhole = fieldOf(text, "appl_ptr").has_value();
    if (state == kStates.end() || !owner || *owner < 0 || !isWhole) {
        return std::nullopt;
    }
    return PcmStatus{.state = state->second,
                     .owner = *owner,
                     .trigger = timeOf(text, "trigger_time"),
                     .written = timeOf(text, "tstamp"),
                     .mostAvailable = numberOf<std::uint64_t>(text, "avail_max").value_or(0),
                     .position = numberOf<std::uint64_t>(text, "hw_ptr").value_or(0)};
}

std::optional<PcmFormat> parseFormat(std::string_view text) {
    PcmFormat format{.sample = bridge::cleanText(fieldOf(text, "format").value_or(""), kMostSampleNameBytes),
                     .channels = boundedNumber(text, "channels", kMostChannels),
                     .rate = boundedNumber(text, "rate", kMostRate),
                     .periodFrames = boundedNumber(text, "period_size", kMostFrames),
                     .bufferFrames = boundedNumber(text, "buffer_size", kMostFrames)};
    return format.sample.empty() || format.rate == 0 || format.channels == 0
               ? std::nullopt
               : std::optional(std::move(format));
}

} // namespace tamblo::alsa
