#pragma once

#include "tests/service/RealService.h"

#include <gmock/gmock.h>

#include <time.h>

namespace tamblo::wire {

inline void PrintTo(const Reply& reply, std::ostream* out) {
    *out << "reply " << reply.id << (reply.error ? ": " + reply.error->message : std::string());
}

} // namespace tamblo::wire

namespace tamblo::test {

#if defined(__SANITIZE_ADDRESS__) || defined(__SANITIZE_THREAD__)
inline constexpr bool kMemoryIsThatOfTheService = false; ///< but the sanitizer's
#else
inline constexpr bool kMemoryIsThatOfTheService = true;
#endif

/// A service with somebody on it who does no harm, and must be served whatever the others do.
class Hostile : public testing::Test {
protected:
    static constexpr std::int64_t kBystander = 1'000;

    /// With limits, as the members of a JSON object: `"key_bytes": 5`.
    ServiceProcess& start(const std::string& limits = {}, ServiceProcess::Options options = {}) {
        options.preferences.emplace_back("com.vandra.tamblo.limits", "{" + limits + "}");
        service_.emplace(std::move(options));
        bystander_.emplace(service_->socketPath(), kBystander);
        return *service_;
    }
    /// Sends the bystander's next message; whether it is answered.
    bool bystanderIsServed() {
        const auto reply = bystander_->call(message({{"bystander", ++bystanderMessages_}}, {kBystander}));
        return reply && !reply->error;
    }
    void TearDown() override {
        EXPECT_TRUE(bystanderIsServed());
        EXPECT_EQ(bystandersLines(), bystanderMessages_);
        if (kMemoryIsThatOfTheService) {
            EXPECT_LT(peakBytes(), 256U << 20U);
        }
        EXPECT_EQ(service_->stop(), 0) << service_->errorOutput();
    }

    /// In the analytics sink's files, wherever they were moved, under the first of its messages' two names.
    [[nodiscard]] std::size_t bystandersLines() const {
        return std::stoul(run("cat " + (service_->logs() / "analytics-events.jsonl*").string() +
                              " | grep -a '\"bystander\":' | grep -ac tamblo.Playback.Start")
                              .output);
    }
    [[nodiscard]] std::size_t peakBytes() const {
        const std::string status = contentOf("/proc/" + std::to_string(service_->pid()) + "/status");
        return std::stoul(status.substr(status.find("VmHWM:") + 6)) * 1024;
    }
    [[nodiscard]] std::size_t logLines() const { return countOf("\n", service_->errorOutput()); }
    /// Of the service's processor time, for what `work` has it do.
    template <typename Work> double cpuSecondsOf(const Work& work) const {
        const double before = cpuSeconds();
        work();
        return cpuSeconds() - before;
    }

    std::optional<ServiceProcess> service_;
    std::optional<Session> bystander_;

private:
    [[nodiscard]] double cpuSeconds() const {
        clockid_t clock{};
        timespec time{};
        ::clock_getcpuclockid(service_->pid(), &clock);
        ::clock_gettime(clock, &time);
        return static_cast<double>(time.tv_sec) + static_cast<double>(time.tv_nsec) * 1e-9;
    }

    std::size_t bystanderMessages_ = 0;
};

/// That the reply refuses by this limit.
MATCHER_P(RefusesBy, limit, "") {
    return arg && arg->error && arg->error->domain == wire::kProtocolErrorDomain &&
           arg->error->code == -32000 && arg->error->message.find(limit) != std::string::npos;
}
MATCHER(IsDone, "") {
    return arg && !arg->error;
}

inline std::vector<wire::Request> messages(std::size_t count,
                                           const std::function<wire::Request(std::size_t)>& make) {
    std::vector<wire::Request> made;
    for (std::size_t i = 0; i < count; ++i) {
        made.push_back(make(i));
    }
    return made;
}

/// Sends some at a time; whether all are answered.
inline bool callAll(RawClient& client, const std::vector<wire::Request>& requests) {
    constexpr std::size_t kAtATime = 100;
    for (std::size_t i = 0; i < requests.size(); ++i) {
        if (i % kAtATime == 0) {
            std::string frames;
            for (std::size_t next = i; next < std::min(i + kAtATime, requests.size()); ++next) {
                frames += framesOf(requests[next], next);
            }
            client.send(frames);
        }
        if (!client.receive()) {
            return false;
        }
    }
    return true;
}

} // namespace tamblo::test
