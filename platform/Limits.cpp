#include "platform/Limits.h"

#include "platform/Preferences.h"

#include <array>
#include <optional>

namespace tamblo {

namespace {

constexpr std::array kRows = std::to_array<Limits::Row>({
    {"reporters_of_message", &Limits::reportersOfMessage},
    {"entries_of_dictionary", &Limits::entriesOfDictionary},
    {"key_bytes", &Limits::keyBytes},
    {"bytes_of_keys", &Limits::bytesOfKeys},
    {"decoded_bytes_of_frame", &Limits::decodedBytesOfFrame},
    {"delivered_bytes_of_message", &Limits::deliveredBytesOfMessage},
    {"application_name_bytes", &Limits::applicationNameBytes},
    {"configuration_bytes_of_session", &Limits::configurationBytesOfSession},
    {"configuration_bytes_of_user", &Limits::configurationBytesOfUser},
    {"previous_keys_of_session", &Limits::previousKeysOfSession},
    {"sessions_of_connection", &Limits::sessionsOfConnection},
    {"sessions_of_user", &Limits::sessionsOfUser},
    {"connections_of_user", &Limits::connectionsOfUser},
    {"retained_bytes_of_user", &Limits::retainedBytesOfUser},
    {"retained_bytes", &Limits::retainedBytes},
    {"waiting_requests", &Limits::waitingRequests},
    {"waiting_bytes", &Limits::waitingBytes},
    {"waiting_bytes_of_user", &Limits::waitingBytesOfUser},
    {"unfinished_bytes_of_user", &Limits::unfinishedBytesOfUser},
    {"frame_seconds", &Limits::frameSeconds},
    {"reply_bytes", &Limits::replyBytes},
    {"reply_bytes_of_user", &Limits::replyBytesOfUser},
});

} // namespace

std::span<const Limits::Row> Limits::rows() noexcept {
    return kRows;
}

std::optional<std::size_t> Limits::preferenceOf(const Preferences& preferences, std::string_view name) {
    const std::optional<Value> value = preferences.copyPreferenceValue(name, kLimitsDomain);
    return value && value->isNumber() && value->integerValue() > 0
               ? std::optional(static_cast<std::size_t>(value->integerValue()))
               : std::nullopt;
}

Limits Limits::read(const Preferences& preferences) {
    Limits limits;
    for (const auto& [name, member] : kRows) {
        limits.*member = preferenceOf(preferences, name).value_or(limits.*member);
    }
    return limits;
}

} // namespace tamblo
