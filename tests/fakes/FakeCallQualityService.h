#pragma once

#include "platform/CallQualityService.h"

#include <memory>
#include <mutex>
#include <optional>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

namespace tamblo {

/// Keeps what its sessions are given; finds back ends when a test says so.
class FakeCallQualityService final : public CallQualityService {
public:
    struct Message {
        std::uint16_t category;
        std::uint16_t type;
        Dictionary payload;
    };
    struct FakeSession final : Session {
        [[nodiscard]] std::string description() const override { return "fake session"; }

        Dictionary sessionInfo, userInfo;
        std::vector<Message> messages;
        int flushes = 0;
    };

    [[nodiscard]] std::optional<std::string> NewHierarchyToken(std::string_view) override { return token; }
    [[nodiscard]] SessionRef CreateLinkmeterSession(const Dictionary& sessionInfo,
                                                    const Dictionary& userInfo) override {
        auto session = std::make_shared<FakeSession>();
        session->sessionInfo = sessionInfo;
        session->userInfo = userInfo;
        sessions.push_back(session);
        return session;
    }
    void StartConfiguration(const SessionRef&, Completion completion) override {
        completions.push_back(std::move(completion));
    }
    [[nodiscard]] std::optional<std::string> SendLinkmeterMessage(const SessionRef& session,
                                                                  std::uint16_t category, std::uint16_t type,
                                                                  const Dictionary& payload) override {
        if (sendFailure || session == nullptr) {
            return sendFailure;
        }
        static_cast<FakeSession&>(*session).messages.push_back({category, type, payload});
        return std::nullopt;
    }
    void FlushMessages(const SessionRef& session) override { ++static_cast<FakeSession&>(*session).flushes; }

    /// Answers the oldest configuration that waits.
    void findBackends(const std::optional<std::vector<std::string>>& backends) {
        Completion completion = std::move(completions.front());
        completions.erase(completions.begin());
        completion(backends);
    }

    std::optional<std::string> token = "token";
    std::optional<std::string> sendFailure;
    std::vector<std::shared_ptr<FakeSession>> sessions;
    std::vector<Completion> completions;
};

} // namespace tamblo
