#include "workers/ZRReportingSessionWorkerUtility.h"

#include "session/MessageIntake.h"

namespace tamblo {

std::optional<std::size_t> RapidMessages::firstKeyOf(const Dictionary& payload) {
    const KeyPlaces::Places& found = places_.in(payload.keys());
    for (std::size_t key = 0; key < keyCount_; ++key) {
        if (found[key] != KeyPlaces::kAbsent) {
            return key;
        }
    }
    return std::nullopt;
}

/// Whether the message was taken into the burst's first one.
bool RapidMessages::takeIn(ZRReportingSessionMessage& message, std::size_t key) {
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

void RapidMessages::add(ZRReportingSessionMessage& message) {
    const auto key = firstKeyOf(message.payload());
    if (!key || !takeIn(message, *key)) {
        result_.push_back(&message);
    }
}

std::vector<ZRReportingSessionMessage*>
ZRReportingSessionWorkerUtility::combineRapidMessages(std::span<const MessageRef> messages,
                                                      std::span<const std::string_view> keysToCombine,
                                                      std::chrono::duration<double> maximumPausetime) {
    RapidMessages rapid(keysToCombine, maximumPausetime);
    for (const MessageRef& message : messages) {
        rapid.add(*message);
    }
    return rapid.result();
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
