#pragma once

#include "base/Dictionary.h"
#include "client/Vocabulary.h"
#include "wire/Request.h"

#include <cstddef>
#include <cstdint>
#include <vector>

namespace tamblo::bench {

/// What the benchmarks report: messages of a music player, 12 keys and about 400 bytes on the wire each (four
/// texts of 12 to 40 characters, three integers, four doubles and a boolean), of four kinds in turn.
struct Message {
    Dictionary payload;
    client::EventCategory category{};
    client::EventType type{};
};

enum class Variety {
    distinct, ///< a counter and the doubles differ from message to message
    repeated, ///< nine of ten say what the one before said, but for the time
};

/// The message of a number: the same for the same number.
[[nodiscard]] Message makeMessage(std::uint64_t number, Variety variety);

/// Made beforehand, so that making them is in nobody's figure. Sent over and over in the same order; as a
/// message is compared with the one before it only, they stay as distinct as they are.
[[nodiscard]] std::vector<Message> makeMessages(std::size_t count, Variety variety);

/// One message in ten is of the haptic engine's use and one in fifty of an issue that was detected, so that
/// every sink has its part; the others are those of `makeMessages`.
inline constexpr std::size_t kHapticsEvery = 10;
inline constexpr std::size_t kIssueEvery = 50;
[[nodiscard]] std::vector<Message> makeMixedMessages(std::size_t count);

/// What a player configures its session with.
[[nodiscard]] Dictionary sessionConfiguration();

[[nodiscard]] wire::Request sendRequest(const Message& message, std::int64_t reporterID);
/// Those of distinct messages.
[[nodiscard]] std::vector<wire::Request> sendRequests(std::size_t count, std::int64_t reporterID);

} // namespace tamblo::bench
