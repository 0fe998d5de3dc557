#pragma once

#include "base/Dictionary.h"
#include "client/Vocabulary.h"

#include <cstdint>
#include <cstdio>
#include <map>
#include <optional>
#include <string>
#include <string_view>
#include <variant>

namespace tamblo::tools {

/// What the first line of a session file may say of the session that was recorded:
///
///   {"session": {"service_type": "longformaudio", "configuration": {…}}}
///
/// Further members are for people.
struct SessionHeader {
    std::optional<client::ServiceType> serviceType;
    std::optional<Dictionary> configuration;
};

/// Nothing when the line is no header; or what is wrong with it.
[[nodiscard]] std::variant<std::optional<SessionHeader>, std::string>
parseSessionHeader(std::string_view text);

/// A message as the service has recorded it, in one of its sinks or in a tap.
struct RecordedMessage {
    double offset = 0; ///< seconds since the session's start
    std::uint32_t category = 0;
    std::uint16_t type = 0;
    Dictionary payload;
};

/// Why a message does not belong into a session file: playing it has the service make it anew.
enum class MadeByService : std::uint8_t { summaries, driverStatistics, deviceFeatures };

/// Which of the service's own messages it is; nothing for a client's.
[[nodiscard]] std::optional<MadeByService> madeByService(const RecordedMessage& message);

/// The whole category of a message of which only the kind is known, the low half: the key `audiotag`, which
/// the service adds, names the subsystem as well.
[[nodiscard]] std::uint32_t categoryOfKind(std::uint16_t kind, std::uint16_t type, const Dictionary& payload);

/// Writes a session file, line by line. What the service adds to each message is taken out again, as it would
/// come twice.
class SessionFileWriter {
public:
    /// `file` is the caller's.
    explicit SessionFileWriter(std::FILE* file) : file_(file) {}

    /// `about` are the header's further members.
    void writeHeader(std::string_view serviceType, const Dictionary& configuration, const Dictionary& about);
    /// Writes the message, or counts it among those that are left out. Messages must come in order: one that
    /// is said to be earlier than the one before it, by a clock that was set back, gets its offset.
    void take(RecordedMessage message);

    [[nodiscard]] std::uint64_t written() const noexcept { return written_; }
    /// The last message's offset.
    [[nodiscard]] double seconds() const noexcept { return last_; }
    /// For people: what was left out and why, with a comma in front of each; empty when nothing was.
    [[nodiscard]] std::string leftOut() const;

private:
    void writeLine(std::string_view line);

    std::FILE* const file_;
    Value application_ = Value("Unknown"); ///< which the service adds to messages without one
    std::uint64_t written_ = 0;
    std::uint64_t setBack_ = 0; ///< messages that were earlier than the one before
    double last_ = 0;
    std::map<MadeByService, std::uint64_t> leftOut_;
};

} // namespace tamblo::tools
