#pragma once

#include "client/Client.h"

#include <chrono>
#include <cstdint>
#include <istream>
#include <memory>
#include <optional>
#include <string>
#include <string_view>
#include <utility>
#include <variant>

namespace tamblo::tools {

inline constexpr std::string_view kTimestampKey = "zrreporting_timestamp";

/// One line of a recorded session:
///
///   {"offset_s": 0.5, "category": "Session_Playback", "type": "Start", "payload": {…}}
///
/// The offset is in seconds since the session's start and may be missing; the payload too. Category and type
/// are names or numbers; a missing type is Generic.
struct SessionLine {
    std::optional<double> offset;
    client::EventCategory category{};
    client::EventType type{};
    Dictionary payload;
};

/// Or a line that says what is wrong.
[[nodiscard]] std::variant<SessionLine, std::string> parseSessionLine(std::string_view text);

/// Says when each line of a session is due, in seconds after the first: at its offset, or, without one, as
/// long after the first as its payload's timestamp is after the first one's; without both, together with the
/// line before.
class SessionSpacing {
public:
    [[nodiscard]] double due(const SessionLine& line);

private:
    std::optional<double> timestampOfStart_; ///< what offset 0 is
    double last_ = 0;
};

/// Plays a recorded session's lines to a reporter: each at its time, without ever having more under way than
/// the service works off, and counts what becomes of them. Used on one thread, which pumps the client.
class SessionPlayer {
public:
    struct Options {
        std::int64_t reporterID = 0;
        /// How much faster than recorded; nothing: as fast as the service takes them.
        std::optional<double> speed = 1;
        /// Gives every message a fresh timestamp, not just those that have none.
        bool restamp = false;
        /// The recording's length in seconds, when the timestamps that it gives are to be as far apart as
        /// recorded, whatever the speed. The last message's is the time at which that is sent, so that a
        /// session that is played faster seems to have begun earlier.
        std::optional<double> recordedLength{};
        /// A line that was read in front of the others.
        std::optional<std::string> firstLine{};
        bool showsProgress = false;
        std::chrono::milliseconds timeout{};
    };
    struct Report {
        std::uint64_t sent = 0;
        std::uint64_t answered = 0;
        std::uint64_t refused = 0; ///< answered with an error
        double seconds = 0;
        std::optional<client::Error> firstError;

        void noteRefusal(client::Error error) {
            ++refused;
            if (!firstError) {
                firstError = std::move(error);
            }
        }
    };

    SessionPlayer(client::Client& client, Options options)
        : client_(client), options_(std::move(options)), report_(std::make_shared<Report>()) {}

    /// Plays to the end, or to the first line that is wrong: says in `name:line: …` what is wrong with it.
    /// A header in the first line is passed over.
    [[nodiscard]] std::optional<std::string> play(std::istream& lines, const std::string& name);
    [[nodiscard]] const Report& report() const noexcept { return *report_; }

private:
    using Clock = std::chrono::steady_clock;

    void waitUntil(Clock::time_point time);
    void send(SessionLine& line, double due);
    [[nodiscard]] double timestampFor(double due) const;
    [[nodiscard]] bool isLost() const noexcept { return !client_.isConnected(); }
    void waitForReplies();
    void showProgress(bool isLast);

    client::Client& client_;
    const Options options_;
    /// Shared with the replies, which may come when the player is gone.
    const std::shared_ptr<Report> report_;
    Clock::time_point start_;
    double startTimestamp_ = 0; ///< the start in seconds since 1970
    Clock::time_point lastShown_{};
};

/// When the last line is due, found by reading the stream, which is then at its beginning again; nothing when
/// it cannot be read twice. Lines that are wrong count nothing.
[[nodiscard]] std::optional<double> recordedLength(std::istream& lines);

} // namespace tamblo::tools
