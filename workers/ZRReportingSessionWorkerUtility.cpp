#include "workers/ZRReportingSessionWorkerUtility.h"

#include "session/MessageIntake.h"

namespace tamblo {

std::optional<std::size_t> RapidMessages::firstKeyOf(const KeySet& keys) {
    const KeyPlaces::Places& found = places_.in(keys);
    for (std::size_t key = 0; key < keyCount_; ++key) {
        if (found[key] != KeyPlaces::kAbsent) {
            return key;
        }
    }
    return std::nullopt;
}

std::optional<std::size_t> RapidMessages::add(std::span<const MessageRef> messages, std::size_t place) {
    const Dictionary& payload = messages[place]->payload();
    const std::optional<std::size_t> key = firstKeyOf(payload.keys());
    if (!key) {
        return std::nullopt;
    }
    const std::uint32_t bit = std::uint32_t{1} << *key;
    if ((seenKeys_ & bit) != 0) {
        seenKeys_ = 0;
        anchor_.reset();
    }
    seenKeys_ |= bit;
    if (!anchor_) {
        anchor_ = place;
        return std::nullopt;
    }
    ZRReportingSessionMessage& anchor = *messages[*anchor_];
    const std::chrono::duration<double> pause(intake::epochTime(payload) -
                                              intake::epochTime(anchor.payload()));
    if (!(pause < maximumPause_)) {
        // The anchor is meant to stay: what comes later than that stands alone until a key repeats.
        return std::nullopt;
    }
    anchor.editPayload([&payload](Dictionary& taking) { taking.merge(payload); });
    return anchor_;
}

std::vector<ZRReportingSessionMessage*>
ZRReportingSessionWorkerUtility::combineRapidMessages(std::span<const MessageRef> messages,
                                                      std::span<const std::string_view> keysToCombine,
                                                      std::chrono::duration<double> maximumPausetime) {
    RapidMessages rapid(keysToCombine, maximumPausetime);
    std::vector<ZRReportingSessionMessage*> combined;
    for (std::size_t place = 0; place < messages.size(); ++place) {
        if (!rapid.add(messages, place)) {
            combined.push_back(messages[place].get());
        }
    }
    return combined;
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
