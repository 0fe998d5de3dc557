#pragma once

#include "client/Client.h"
#include "tools/SessionFile.h"

#include <chrono>
#include <cstdint>
#include <istream>
#include <memory>
#include <optional>
#include <string>
#include <utility>

namespace tamblo::tools {

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
        /// Timestamps that it gives are as far apart as the messages were recorded, whatever the speed: those
        /// of a session that is played faster run ahead of the clock.
        bool stampsAsRecorded = false;
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
        : client_(client), options_(options), report_(std::make_shared<Report>()) {}

    /// Plays to the end, or to the first line that is wrong: says in `name:line: …` what is wrong with it.
    [[nodiscard]] std::optional<std::string> play(std::istream& lines, const std::string& name);
    [[nodiscard]] const Report& report() const noexcept { return *report_; }

private:
    using Clock = std::chrono::steady_clock;

    void waitUntil(Clock::time_point time);
    void send(SessionLine& line, double due);
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

} // namespace tamblo::tools
