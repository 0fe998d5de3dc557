#pragma once

#include "bridge/common/Reporter.h"
#include "bridge/common/Time.h"

#include <string>
#include <utility>
#include <vector>

namespace tamblo::bridge::test {

class HandClock final : public Clock {
public:
    [[nodiscard]] Moment now() const override { return now_; }
    void advance(std::chrono::milliseconds time) {
        now_.steady += time;
        now_.wall += time;
    }

private:
    Moment now_{SteadyTime(std::chrono::hours(1)), WallTime(std::chrono::seconds(1'700'000'000))};
};

/// Keeps what was reported.
class KeptReports final : public Reporter {
public:
    struct Session {
        ServiceType serviceType;
        std::string application;
        bool hasEnded = false;
    };
    struct Message {
        SessionID session;
        std::string category;
        std::string type;
        Dictionary payload;
        WallTime at;
    };

    [[nodiscard]] bool isReachable() const override { return isThere; }
    [[nodiscard]] SessionID begin(ServiceType serviceType, const std::string& application) override {
        if (!isThere) {
            return kNoSession;
        }
        sessions.push_back({serviceType, application});
        return static_cast<SessionID>(sessions.size());
    }
    void send(SessionID session, EventCategory category, EventType type, Dictionary payload,
              WallTime at) override {
        if (session != kNoSession) {
            messages.push_back({session, client::categoryName(category), std::string(client::typeName(type)),
                                std::move(payload), at});
        }
    }
    void end(SessionID session) override {
        sessions.at(static_cast<std::size_t>(session - 1)).hasEnded = true;
    }

    /// "1 Session_Playback Start, ..."
    [[nodiscard]] std::string story() const {
        std::string text;
        for (const Message& message : messages) {
            text += (text.empty() ? "" : ", ") + std::to_string(message.session) + " " + message.category +
                    " " + message.type;
        }
        return text;
    }

    bool isThere = true;
    std::vector<Session> sessions;
    std::vector<Message> messages;
};

} // namespace tamblo::bridge::test
