#pragma once

#include "platform/BugCaptureService.h"

#include <memory>
#include <optional>
#include <string>
#include <utility>
#include <vector>

namespace tamblo {

/// Keeps what its reporters ask for; accepts and answers as a test says.
class FakeBugCaptureService final : public BugCaptureService {
public:
    struct Request {
        std::string operation; ///< "snapshot", "start" or "cancel"
        std::vector<pid_t> processes;
        BugCaptureSignature signature;
        std::chrono::duration<double> duration{0};
        Dictionary payload;
        std::string session; ///< of a "cancel"
    };

    [[nodiscard]] std::unique_ptr<GlarnReporter> makeReporter(std::span<const pid_t> processes) override {
        ++reportersMade;
        return std::make_unique<Reporter>(*this, std::vector(processes.begin(), processes.end()));
    }
    /// Answers the oldest request that waits.
    void answer(const Dictionary& response) {
        GlarnReporter::Reply reply = std::move(replies.front());
        replies.erase(replies.begin());
        reply(response);
    }

    bool accepts = true;
    /// Given to every request before it returns; without one, replies wait for `answer`.
    std::optional<Dictionary> promptAnswer;
    int reportersMade = 0;
    std::vector<Request> requests;
    std::vector<GlarnReporter::Reply> replies;

private:
    class Reporter final : public GlarnReporter {
    public:
        Reporter(FakeBugCaptureService& owner, std::vector<pid_t> processes)
            : owner_(owner), processes_(std::move(processes)) {}
        [[nodiscard]] bool snapshot(const BugCaptureSignature& signature,
                                    std::chrono::duration<double> duration, const Dictionary& payload,
                                    Reply reply) override {
            return owner_.take({"snapshot", processes_, signature, duration, payload, {}}, std::move(reply));
        }
        [[nodiscard]] bool startSession(const BugCaptureSignature& signature,
                                        std::chrono::duration<double> duration, Reply reply) override {
            return owner_.take({"start", processes_, signature, duration, {}, {}}, std::move(reply));
        }
        void cancelSession(std::string_view sessionIdentifier) override {
            owner_.requests.push_back({"cancel", processes_, {}, {}, {}, std::string(sessionIdentifier)});
        }

    private:
        FakeBugCaptureService& owner_;
        const std::vector<pid_t> processes_;
    };

    bool take(Request request, GlarnReporter::Reply reply) {
        requests.push_back(std::move(request));
        if (accepts && promptAnswer) {
            reply(*promptAnswer);
        } else if (accepts) {
            replies.push_back(std::move(reply));
        }
        return accepts;
    }
};

} // namespace tamblo
