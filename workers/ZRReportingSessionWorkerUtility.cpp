#include "workers/ZRReportingSessionWorkerUtility.h"

#include "base/KeyPlaces.h"
#include "session/MessageIntake.h"

#include <cstddef>
#include <cstdint>
#include <optional>

namespace tamblo {

namespace {

/// The first of the keys that the payload holds.
std::optional<std::size_t> firstKeyOf(const Dictionary& payload, KeyPlaces& places, std::size_t keyCount) {
    const KeyPlaces::Places& found = places.in(payload.keys());
    for (std::size_t key = 0; key < keyCount; ++key) {
        if (found[key] != KeyPlaces::kAbsent) {
            return key;
        }
    }
    return std::nullopt;
}

/// The burst at hand: the keys that it has and the message that takes the others in, null when none does.
class Burst {
public:
    explicit Burst(std::chrono::duration<double> maximumPause) noexcept : maximumPause_(maximumPause) {}

    /// Whether the message was taken into the burst's first one.
    bool takeIn(ZRReportingSessionMessage& message, std::size_t key) {
        const std::uint32_t bit = std::uint32_t{1} << key;
        if ((seenKeys_ & bit) != 0) {
            seenKeys_ = 0;
            anchor_ = nullptr;
        }
        seenKeys_ |= bit;
        if (anchor_ == nullptr) {
            anchor_ = &message;
            return false;
        }
        const std::chrono::duration<double> pause(intake::epochTime(message.payload()) -
                                                  intake::epochTime(anchor_->payload()));
        if (!(pause < maximumPause_)) {
            // The anchor is meant to stay: what comes later than that stands alone until a key repeats.
            return false;
        }
        anchor_->editPayload([&message](Dictionary& payload) { payload.merge(message.payload()); });
        return true;
    }

private:
    const std::chrono::duration<double> maximumPause_;
    std::uint32_t seenKeys_ = 0;
    ZRReportingSessionMessage* anchor_ = nullptr;
};

} // namespace

std::vector<ZRReportingSessionMessage*>
ZRReportingSessionWorkerUtility::combineRapidMessages(std::span<const MessageRef> messages,
                                                      std::span<const std::string_view> keysToCombine,
                                                      std::chrono::duration<double> maximumPausetime) {
    KeyPlaces places(keysToCombine);
    Burst burst(maximumPausetime);
    std::vector<ZRReportingSessionMessage*> result;
    result.reserve(messages.size());
    for (const MessageRef& message : messages) {
        const auto key = firstKeyOf(message->payload(), places, keysToCombine.size());
        if (!key || !burst.takeIn(*message, *key)) {
            result.push_back(message.get());
        }
    }
    return result;
}

bool ZRReportingSessionWorkerUtility::isTalvixXYerrorMessage(
    const ZRReportingSessionMessage& message) noexcept {
    const Dictionary& payload = message.payload();
    for (std::size_t i = 0; i < payload.size(); ++i) {
        if (payload.keyAt(i).starts_with("tvac_invalid_")) {
            return true;
        }
    }
    return false;
}

} // namespace tamblo
