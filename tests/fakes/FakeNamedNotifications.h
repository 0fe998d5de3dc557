#pragma once

#include "platform/NamedNotifications.h"

#include <cstddef>
#include <cstdint>
#include <map>
#include <memory>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

namespace tamblo {

/// Notifications that a test posts; the handlers run when the test runs their queue.
class FakeNamedNotifications final : public NamedNotifications {
public:
    [[nodiscard]] Registration RegisterNamedNotification(std::string_view name, SerialQueue& queue,
                                                         Handler handler) override {
        if (registrationStatus != 0) {
            return {registrationStatus, 0};
        }
        registered_[++lastToken_] = {std::string(name), &queue,
                                     std::make_shared<Handler>(std::move(handler))};
        return {0, lastToken_};
    }
    [[nodiscard]] State GetNamedNotificationState(int token) override {
        const auto found = registered_.find(token);
        const auto word = found != registered_.end() ? words_.find(found->second.name) : words_.end();
        return word != words_.end() ? State{0, word->second} : State{kNoState, 0};
    }
    [[nodiscard]] int PostNamedNotification(std::string_view name) override {
        posted.emplace_back(name);
        post(posted.back(), words_[posted.back()]);
        return 0;
    }
    void CancelNamedNotification(int token) override { registered_.erase(token); }

    void post(const std::string& name, std::uint64_t word) {
        words_[name] = word;
        for (const auto& [token, registration] : registered_) {
            if (registration.name == name) {
                registration.queue->post([this, which = token] { call(which); }, Pace::mayBlock);
            }
        }
    }
    [[nodiscard]] std::size_t registrationCount() const noexcept { return registered_.size(); }

    /// The names that the service itself has posted.
    std::vector<std::string> posted;
    /// What registering answers; other than 0, it fails.
    int registrationStatus = 0;

private:
    static constexpr int kNoState = 1;

    struct Registered {
        std::string name;
        SerialQueue* queue;
        std::shared_ptr<Handler> handler;
    };

    void call(int token) {
        const auto found = registered_.find(token);
        if (found != registered_.end()) {
            const auto handler = found->second.handler;
            (*handler)(token);
        }
    }

    std::map<int, Registered> registered_;
    std::map<std::string, std::uint64_t> words_;
    int lastToken_ = 0;
};

} // namespace tamblo
