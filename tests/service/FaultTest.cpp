#include "tests/service/RawClient.h"
#include "tests/service/ServiceProcess.h"

#include <gmock/gmock.h>
#include <nlohmann/json.hpp>

#include <algorithm>
#include <csignal>
#include <memory>
#include <ranges>
#include <string>
#include <vector>

#include <poll.h>
#include <sys/socket.h>

// What clients and the machine can do wrong, and that nobody else notices.

namespace tamblo::test {
namespace {

using testing::HasSubstr;

/// A service in trouble, with a client that was there before and must still be served afterwards.
class Fault : public testing::Test {
protected:
    ServiceProcess& start(ServiceProcess::Options options = {}) {
        service_.emplace(std::move(options));
        bystander_.emplace(service_->socketPath(), 1000);
        return *service_;
    }
    void TearDown() override {
        EXPECT_EQ(bystander_->call(Method::getServiceNameForReporterID, 1000)->result, Value(2));
    }

private:
    std::optional<ServiceProcess> service_;
    std::optional<Session> bystander_;
};

/// How much of this the service takes, without a reply being read, before it holds the sender back.
std::size_t acceptedOf(const RawClient& client, std::string_view bytes) {
    constexpr int patienceMilliseconds = 100;
    std::size_t sent = 0;
    pollfd writable{.fd = client.descriptor(), .events = POLLOUT, .revents = 0};
    while (sent < bytes.size() && ::poll(&writable, 1, patienceMilliseconds) == 1) {
        const ssize_t count = ::send(client.descriptor(), bytes.data() + sent, bytes.size() - sent,
                                     MSG_DONTWAIT | MSG_NOSIGNAL);
        sent += count > 0 ? static_cast<std::size_t>(count) : 0U;
    }
    return sent;
}

TEST_F(Fault, WhatIsNoRequestEndsItsConnectionOnlyWhereNothingCanFollow) {
    ServiceProcess& service = start();
    const struct {
        std::string bytes;
        std::int64_t code;
        std::uint64_t id;
        bool endsConnection;
    } cases[] = {
        {{"\x01\0\0\0\x1C", 5}, wire::kNotWellFormed, 0, true},
        {{"\x01\0\x10\0", 4}, wire::kNotARequest, 0, true},
        {{"\x01\0\0\0\xA0", 5}, wire::kNotARequest, 0, false},
        // A null in the payload.
        {{"\x18\0\0\0\x84\0\x05\x6BsendMessage\x84\xA1\x61k\xF6\x01\x02\x81\x07", 28}, -32602, 5, false},
    };
    std::size_t ended = 0, interrupted = 0;
    for (const auto& row : cases) {
        const std::size_t before = service.countEvents("Playback.Start");
        Session client(service.socketPath());
        client.send(row.bytes);
        const auto reply = client.receive();
        ASSERT_TRUE(reply && reply->error);
        EXPECT_EQ(reply->id, row.id);
        EXPECT_EQ(reply->error->domain, wire::kProtocolErrorDomain);
        EXPECT_EQ(reply->error->code, row.code);
        EXPECT_FALSE(reply->error->message.empty());
        if (row.endsConnection) {
            ++ended;
            ++interrupted;
            EXPECT_TRUE(client.isClosedByService());
            EXPECT_TRUE(eventually([&] {
                return countOf("invalidationHandler: connection exited", service.errorOutput()) == ended;
            }));
            EXPECT_EQ(countOf("interruptionHandler: connection exited", service.errorOutput()), interrupted);
        } else {
            // The longest that is allowed.
            EXPECT_FALSE(
                client.call(message({{"k", std::string(wire::kMaximumFrameBytes - 100, 'x')}}))->error);
            EXPECT_EQ(service.countEvents("Playback.Start"), before + 2U);
            ++ended;
        }
    }
}

TEST_F(Fault, RequestsBeforeTheFaultAreAnswered) {
    ServiceProcess& service = start();
    for (int round = 0; round < 20; ++round) {
        RawClient client(service.socketPath());
        // The start hands what follows it to another thread, which has the message's events to write.
        client.send(framesOf(request(Method::createReportingSession, 7), 1) +
                    framesOf(request(Method::startReportingSessionForID, 7), 2) +
                    framesOf(message({{"n", round}}), 3) +
                    framesOf(request(Method::stopReportingSessionForID, 7), 4) + "\x01" +
                    std::string("\0\0\0\x1C", 4));
        std::vector<std::uint64_t> answered;
        for (auto reply = client.receive(); reply; reply = client.receive()) {
            answered.push_back(reply->id);
        }
        EXPECT_THAT(answered, testing::UnorderedElementsAre(0, 1, 2, 3, 4));
    }
}

TEST_F(Fault, AQueueThatWaitsHoldsSendersBackAndServesThemInFull) {
    ServiceProcess& service = start(
        {.isInternalBuild = true,
         .preferences = {{kCaptures, R"({"enable_stackburst": true, "io_cycle": {}, "wait_time": 1.5e6})"}},
         .environment = {{"TAMBLO_LOG", "error"}}});
    Session client(service.socketPath());
    Session manySmall(service.socketPath(), 8);
    RawClient fewLarge(service.socketPath()), other(service.socketPath());
    client.send(framesOf(message({{"smallest_buffer_frame_size", 512}}, {7}, 7, 6), 99));

    // Many small requests, and few large ones, each more than the service may keep waiting.
    constexpr int kSmall = 20'000, kLarge = 16;
    std::string small;
    for (int i = 0; i < kSmall; ++i) {
        small += framesOf(message({{"n", i}}, {8}));
    }
    const std::string large = framesOf(message({{"k", std::string(1'000'000, 'x')}}, {12345}), 1, kLarge);
    const std::size_t smallTaken = acceptedOf(manySmall, small);
    const std::size_t largeTaken = acceptedOf(fewLarge, large);
    EXPECT_LT(smallTaken, small.size() / 2);
    EXPECT_LT(largeTaken, large.size() / 2);
    // What no session has to do with is answered meanwhile.
    other.send(std::string("\x08\0\0\0\x84\0\x01\x63xyz\x80", 12));
    EXPECT_TRUE(other.receive());
    EXPECT_TRUE(client.staysSilent()) << "the machine was too slow to tell";

    EXPECT_EQ(client.receive()->id, 99U);
    EXPECT_EQ(contentOf(service.runtimeDirectory() + "/notifications/com.vandra.tamblo.dropped-stackburst"),
              "0\n");
    EXPECT_THAT(service.errorOutput(), HasSubstr("io_cycle: a dictionary in place of a number"));
    const auto isServedInFull = [](RawClient& sender, const std::string& rest, int requests) {
        return sender.send(rest) && std::ranges::all_of(std::views::iota(0, requests),
                                                        [&](int) { return sender.receive().has_value(); });
    };
    EXPECT_TRUE(isServedInFull(manySmall, small.substr(smallTaken), kSmall));
    EXPECT_TRUE(isServedInFull(fewLarge, large.substr(largeTaken), kLarge));
    EXPECT_EQ(service.countEvents("Playback.Start"), 2U * kSmall);
}

TEST_F(Fault, ClientThatNeverReadsIsClosed) {
    ServiceProcess& service = start({.environment = {{"TAMBLO_LOG", "error"}}});
    RawClient client(service.socketPath());
    for (int i = 0; i < 200; ++i) {
        client.send(framesOf(request(Method::createReportingSession, 1'000'000'000'000 + i)));
    }
    const std::string frame = framesOf(request(Method::getAllReporters));
    int sent = 0;
    while (sent < 10'000 && client.send(frame)) {
        ++sent;
    }
    // Each answer takes 1.8 kB, and the kernel holds some hundred kilobytes of them.
    EXPECT_GT(sent, 2'000);
    EXPECT_LT(sent, 10'000);
    EXPECT_TRUE(client.isClosedByService());
}

TEST_F(Fault, RepliesOfOneBatchTakeBoundedMemory) {
    ServiceProcess& service = start({.environment = {{"TAMBLO_LOG", "error"}}});
    RawClient client(service.socketPath());
    std::string frames;
    for (int i = 0; i < 10'000; ++i) {
        frames += framesOf(request(Method::createReportingSession, 1'000'000'000'000 + i));
    }
    client.send(frames);
    for (int i = 0; i < 10'000; ++i) {
        ASSERT_TRUE(client.receive());
    }
    // Some thousand requests that arrive with one read, whose answers take half a gigabyte.
    std::string reporters;
    for (int i = 0; i < 6'000; ++i) {
        reporters += std::string("\x14\0\0\0\x84\0\x01\x6FgetAllReporters\x80", 24);
    }
    service.signal(SIGSTOP);
    client.send(reporters);
    service.signal(SIGCONT);
    EXPECT_TRUE(client.isClosedByService());
    const std::string status = contentOf("/proc/" + std::to_string(service.pid()) + "/status");
    // 30 MB as it is built to be shipped; sanitizers hold back what was freed.
    EXPECT_LT(std::stoul(status.substr(status.find("VmHWM:") + 6)), 450'000U) << "kilobytes";
}

TEST_F(Fault, AcceptingGoesOnAfterTheDescriptorsWereGone) {
    ServiceProcess& service = start({.descriptorLimit = 32});
    std::vector<std::unique_ptr<RawClient>> clients;
    for (int i = 0; i < 60; ++i) {
        clients.push_back(std::make_unique<RawClient>(service.socketPath()));
    }
    EXPECT_TRUE(
        eventually([&] { return countOf("accepting connections rests", service.errorOutput()) > 0; }));
    clients.erase(clients.begin(), clients.begin() + 50);
    EXPECT_TRUE(clients.back()->call(Method::getAllReporters));
    EXPECT_THAT(service.errorOutput(), HasSubstr("accepting connections again"));
}

TEST_F(Fault, AFullDiskCostsTheLinesOfItsTimeAndNothingElse) {
    constexpr rlim_t kRoom = 20'000;
    ServiceProcess& service = start({.environment = {{"TAMBLO_LOG", "error"}}, .fileSizeLimit = kRoom});
    Session client(service.socketPath());
    std::size_t sent = 0;
    const auto send = [&](int messages) {
        for (int i = 0; i < messages; ++i) {
            const auto reply = client.call(message({{"n", 1000 + sent++}}));
            ASSERT_TRUE(reply && !reply->error);
        }
    };
    const auto file = service.logs() / "analytics-events.jsonl";
    send(200);
    EXPECT_LE(contentOf(file).size(), kRoom);
    EXPECT_TRUE(contentOf(file).ends_with('\n'));
    service.liftFileSizeLimit();
    send(10);

    EXPECT_TRUE(std::ranges::all_of(linesOf(file), [](auto& line) { return nlohmann::json::accept(line); }));
    EXPECT_EQ(service.countEvents("\"n\":1209"), 2U);
    const std::string lost = std::to_string(2 * sent - service.countEvents("\"n\":1"));
    const std::string said = service.errorOutput();
    EXPECT_EQ(countOf("analytics-events.jsonl: cannot write: ", said), 1U) << said;
    EXPECT_EQ(
        countOf("analytics-events.jsonl: it can be written again; " + lost + " records were lost\n", said),
        1U)
        << said;
}

} // namespace
} // namespace tamblo::test
