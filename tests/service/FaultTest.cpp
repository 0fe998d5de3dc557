#include "tests/service/RealService.h"

#include <gmock/gmock.h>
#include <nlohmann/json.hpp>

#include <list>
#include <map>
#include <ranges>

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
    std::size_t sent = 0;
    pollfd writable{.fd = client.descriptor(), .events = POLLOUT, .revents = 0};
    while (sent < bytes.size() && ::poll(&writable, 1, 100) == 1) {
        const ssize_t count = ::send(client.descriptor(), bytes.data() + sent, bytes.size() - sent,
                                     MSG_DONTWAIT | MSG_NOSIGNAL);
        sent += count > 0 ? static_cast<std::size_t>(count) : 0U;
    }
    return sent;
}

TEST_F(Fault, WhatIsNoRequestEndsItsConnectionOnceWhatCameBeforeIsAnsweredIfNothingCanFollow) {
    ServiceProcess& service = start({.environment = {{"TAMBLO_LOG", "info"}}});
    constexpr std::size_t kRounds = 20;
    for (std::size_t round = 0; round < kRounds; ++round) {
        const auto [bytes, code] = round % 2 == 0
                                       ? std::pair(std::string("\x01\0\0\0\x1C", 5), wire::kNotWellFormed)
                                       : std::pair(std::string("\x01\0\x10\0", 4), wire::kNotARequest);
        RawClient client(service.socketPath());
        // The start hands what follows it to another thread, which has the message's events to write.
        client.send(framesOf(request(Method::createReportingSession, 7), 1) +
                    framesOf(request(Method::startReportingSessionForID, 7), 2) +
                    framesOf(message({{"n", round}}), 3) +
                    framesOf(request(Method::stopReportingSessionForID, 7), 4) + bytes);
        std::map<std::uint64_t, std::int64_t> codes;
        while (const auto reply = client.receive()) {
            codes[reply->id] = reply->error ? reply->error->code : 0;
        }
        EXPECT_EQ(codes, (decltype(codes){{0, code}, {1, 0}, {2, 0}, {3, 0}, {4, 0}}));
    }
    EXPECT_TRUE(eventually(
        [&] { return countOf("interruptionHandler: connection exited", service.errorOutput()) == kRounds; }));
    // A frame that is whole costs itself only. What follows is as long as it may be.
    Session client(service.socketPath());
    client.send(std::string("\x01\0\0\0\xA0", 5));
    EXPECT_EQ(client.receive()->error->code, wire::kNotARequest);
    EXPECT_FALSE(client.call(message({{"k", std::string(wire::kMaximumFrameBytes - 100, 'x')}}))->error);
    EXPECT_EQ(service.countEvents("Playback.Start"), 2 * (kRounds + 1));
}

TEST_F(Fault, AQueueThatWaitsHoldsSendersBackAndServesThemInFull) {
    ServiceProcess& service =
        start({.isInternalBuild = true,
               .preferences = {{kCaptures, R"({"enable_stackburst": true, "wait_time": 5e6})"}},
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
    EXPECT_FALSE(client.isReadable(50)) << "the machine was too slow to tell";

    EXPECT_EQ(client.receive()->id, 99U);
    const auto isServedInFull = [](RawClient& sender, const std::string& rest, int requests) {
        return sender.send(rest) && std::ranges::all_of(std::views::iota(0, requests),
                                                        [&](int) { return sender.receive().has_value(); });
    };
    EXPECT_TRUE(isServedInFull(manySmall, small.substr(smallTaken), kSmall));
    EXPECT_TRUE(isServedInFull(fewLarge, large.substr(largeTaken), kLarge));
    EXPECT_EQ(service.countEvents("Playback.Start"), 2U * kSmall);
}

TEST_F(Fault, ClientsThatNeverReadAreClosedAndTakeBoundedMemoryAndOnesThatReadAreServed) {
    ServiceProcess& service = start({.environment = {{"TAMBLO_LOG", "error"}}});
    RawClient owner(service.socketPath()), impatient(service.socketPath()), patient(service.socketPath());
    for (int i = 0; i < 10'000; ++i) {
        ASSERT_TRUE(owner.call(Method::createReportingSession, 1'000'000'000'000 + i));
    }
    // Each answer takes 90 kB, and 4 MB may wait.
    int sent = 0;
    for (; sent < 1'000 && patient.send(framesOf(request(Method::getAllReporters))); ++sent) {
        ::usleep(2'000);
    }
    EXPECT_GT(sent, 40);
    EXPECT_LT(sent, 1'000);
    EXPECT_TRUE(patient.isHungUp());
    // Some thousand requests that arrive with one read, whose answers take half a gigabyte.
    service.signal(SIGSTOP);
    impatient.send(framesOf(request(Method::getAllReporters), 1, 6'000));
    service.signal(SIGCONT);
    RawClient reader(service.socketPath());
    reader.send(framesOf(request(Method::getAllReporters), 1, 100)); // more than may wait
    for (int i = 0; i < 100; ++i) {
        ASSERT_TRUE(reader.receive()) << i;
    }
    EXPECT_TRUE(impatient.isHungUp());
    const std::string status = contentOf("/proc/" + std::to_string(service.pid()) + "/status");
    // 30 MB as it is built to be shipped; sanitizers hold back what was freed.
    EXPECT_LT(std::stoul(status.substr(status.find("VmHWM:") + 6)), 450'000U) << "kilobytes";
}

TEST_F(Fault, AcceptingGoesOnAfterTheDescriptorsWereGone) {
    ServiceProcess& service = start();
    service.limit(RLIMIT_NOFILE, 32);
    std::list<RawClient> clients;
    for (int i = 0; i < 60; ++i) {
        clients.emplace_back(service.socketPath());
    }
    EXPECT_TRUE(
        eventually([&] { return countOf("accepting connections rests", service.errorOutput()) > 0; }));
    clients.erase(clients.begin(), std::prev(clients.end()));
    EXPECT_TRUE(clients.back().call(Method::getAllReporters));
    EXPECT_THAT(service.errorOutput(), HasSubstr("accepting connections again"));
}

TEST_F(Fault, AFullDiskCostsTheLinesOfItsTimeAndNothingElse) {
    constexpr std::size_t kMessages = 210;
    ServiceProcess& service = start({.environment = {{"TAMBLO_LOG", "error"}}});
    service.limit(RLIMIT_FSIZE, 20'000);
    Session client(service.socketPath());
    for (std::size_t i = 0; i < kMessages; ++i) {
        if (i == kMessages - 10) {
            service.limit(RLIMIT_FSIZE, RLIM_INFINITY);
        }
        const auto reply = client.call(message({{"n", 1000 + i}}));
        ASSERT_TRUE(reply && !reply->error);
    }
    const auto lines = linesOf(service.logs() / "analytics-events.jsonl");
    EXPECT_TRUE(std::ranges::all_of(lines, [](auto& line) { return nlohmann::json::accept(line); }));
    EXPECT_THAT(lines.back(), HasSubstr("\"n\":1209"));
    const std::string lost = std::to_string(2 * kMessages - service.countEvents("\"n\":1"));
    for (const std::string& line :
         {std::string("cannot write: "), "it can be written again; " + lost + " records were lost\n"}) {
        EXPECT_EQ(countOf("analytics-events.jsonl: " + line, service.errorOutput()), 1U) << line;
    }
}

} // namespace
} // namespace tamblo::test
