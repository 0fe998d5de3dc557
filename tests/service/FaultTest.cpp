#include "tests/service/RawClient.h"
#include "tests/service/ServiceProcess.h"

#include <gtest/gtest.h>

#include <algorithm>
#include <csignal>
#include <memory>
#include <string>
#include <vector>

#include <sys/resource.h>
#include <sys/socket.h>

// What clients and the machine can do wrong, and that nobody else notices.

namespace tamblo::test {
namespace {

using wire::Method;

/// A client that was there before the fault and must still be served after it.
class Bystander {
public:
    explicit Bystander(ServiceProcess& service) : client_(service.socketPath()) {
        startSession(client_, 1000);
    }
    ~Bystander() {
        EXPECT_EQ(client_.call(request(Method::getServiceNameForReporterID, 1000))->result, Value(2));
    }

private:
    RawClient client_;
};

TEST(Fault, BytesThatAreNoCborEndOnlyTheirConnection) {
    ServiceProcess service;
    const Bystander bystander(service);
    RawClient client(service.socketPath());
    startSession(client, 7);
    client.sendItem("\x1C");
    const auto reply = client.receive();
    ASSERT_TRUE(reply);
    EXPECT_EQ(reply->id, 0U);
    EXPECT_EQ(reply->error->code, wire::kNotWellFormed);
    EXPECT_TRUE(client.isClosedByService());
    EXPECT_TRUE(service.awaitErrorOutput("interruptionHandler: connection exited"));
    EXPECT_TRUE(service.awaitErrorOutput("invalidationHandler: connection exited"));
}

TEST(Fault, RequestsBeforeTheFaultAreAnswered) {
    ServiceProcess service;
    for (int round = 0; round < 20; ++round) {
        RawClient client(service.socketPath());
        TextBuffer frames;
        std::uint64_t id = 0;
        // The start hands what follows it to another thread, which has the message's events to write.
        for (wire::Request next :
             {request(Method::createReportingSession, 7), request(Method::startReportingSessionForID, 7),
              message({{"n", round}}, {7}), request(Method::stopReportingSessionForID, 7)}) {
            next.id = ++id;
            ASSERT_TRUE(wire::appendRequestFrame(frames, next));
        }
        frames.append(std::string_view("\x01\x00\x00\x00\x1C", 5));
        client.sendBytes(frames.view());
        std::vector<std::uint64_t> answered;
        for (auto reply = client.receive(); reply; reply = client.receive()) {
            answered.push_back(reply->id);
        }
        std::sort(answered.begin(), answered.end());
        ASSERT_EQ(answered, (std::vector<std::uint64_t>{0, 1, 2, 3, 4}));
    }
}

TEST(Fault, FrameBeyondTheLimitEndsItsConnection) {
    ServiceProcess service;
    const Bystander bystander(service);
    RawClient client(service.socketPath());
    client.sendBytes(std::string("\x01\x00\x10\x00", 4));
    EXPECT_EQ(client.receive()->error->code, wire::kNotARequest);
    EXPECT_TRUE(client.isClosedByService());

    // The longest that is allowed is carried out.
    RawClient modest(service.socketPath());
    startSession(modest, 7);
    EXPECT_FALSE(modest.call(message({{"k", std::string(wire::kMaximumFrameBytes - 100, 'x')}}, {7}))->error);
}

TEST(Fault, RefusedRequestLeavesTheConnectionAlone) {
    ServiceProcess service;
    RawClient client(service.socketPath());
    startSession(client, 7);
    const std::string send("\x84\x00\x05\x6BsendMessage\x84", 16);
    const std::string nullInside = send + std::string("\xA1\x61k\xF6\x01\x02\x81\x07", 8);
    for (const std::string& item : {nullInside, std::string("\xA0")}) {
        client.sendItem(item);
        const auto reply = client.receive();
        ASSERT_TRUE(reply && reply->error);
        EXPECT_EQ(reply->error->domain, wire::kProtocolErrorDomain);
        EXPECT_FALSE(reply->error->message.empty());
    }
    EXPECT_EQ(service.countEvents("Playback.Start"), 0U);
    EXPECT_FALSE(client.call(message({{"n", 1}}, {7}))->error);
    EXPECT_EQ(service.countEvents("Playback.Start"), 2U);
}

TEST(Fault, FloodIsCarriedOutInFull) {
    ServiceProcess service;
    const Bystander bystander(service);
    RawClient client(service.socketPath());
    startSession(client, 7);
    constexpr int kMessages = 50'000;
    for (int i = 0; i < kMessages; ++i) {
        ASSERT_TRUE(client.send(message({{"n", i}}, {7})));
    }
    EXPECT_TRUE(client.call(request(Method::reporterID, 7)));
    EXPECT_EQ(service.countEvents("Playback.Start"), 2U * kMessages);
}

TEST(Fault, ClientThatNeverReadsIsClosed) {
    ServiceProcess service;
    const Bystander bystander(service);
    RawClient client(service.socketPath());
    for (int i = 0; i < 200; ++i) {
        client.send(request(Method::createReportingSession, 1'000'000'000'000 + i));
    }
    wire::Request reporters = request(Method::getAllReporters);
    reporters.id = 1;
    int sent = 0;
    while (sent < 10'000 && client.send(reporters)) {
        ++sent;
    }
    // Each answer takes 1.8 kB, and the kernel holds some hundred kilobytes of them.
    EXPECT_GT(sent, 2'000);
    EXPECT_LT(sent, 10'000);
    EXPECT_TRUE(client.isClosedByService());
}

TEST(Fault, RepliesOfOneBatchTakeBoundedMemory) {
    ServiceProcess service;
    const Bystander bystander(service);
    RawClient client(service.socketPath());
    for (int i = 0; i < 10'000; ++i) {
        client.send(request(Method::createReportingSession, 1'000'000'000'000 + i));
    }
    ASSERT_TRUE(client.call(request(Method::reporterID, 7)));
    // Some thousand requests that arrive with one read, whose answers take half a gigabyte.
    wire::Request reporters = request(Method::getAllReporters);
    reporters.id = 1;
    TextBuffer frames;
    for (int i = 0; i < 6'000; ++i) {
        ASSERT_TRUE(wire::appendRequestFrame(frames, reporters));
    }
    service.signal(SIGSTOP);
    client.sendBytes(frames.view());
    service.signal(SIGCONT);
    EXPECT_TRUE(client.isClosedByService());
    const std::string status = readFile("/proc/" + std::to_string(service.pid()) + "/status");
    // 30 MB as it is built to be shipped; sanitizers hold back what was freed.
    EXPECT_LT(std::stoul(status.substr(status.find("VmHWM:") + 6)), 450'000U) << "kilobytes";
}

TEST(Fault, AcceptingGoesOnAfterTheDescriptorsWereGone) {
    ServiceProcess service({.environment = {}, .beforeExec = [] {
                                const rlimit limit{32, 32};
                                ::setrlimit(RLIMIT_NOFILE, &limit);
                            }});
    const Bystander bystander(service);
    std::vector<std::unique_ptr<RawClient>> clients;
    for (int i = 0; i < 60; ++i) {
        clients.push_back(std::make_unique<RawClient>(service.socketPath()));
    }
    EXPECT_TRUE(service.awaitErrorOutput("accepting connections rests"));
    clients.erase(clients.begin(), clients.begin() + 50);
    EXPECT_TRUE(clients.back()->call(request(Method::getAllReporters)));
    const std::string said = service.errorOutput();
    EXPECT_NE(said.find("accepting connections again"), std::string::npos);
}

} // namespace
} // namespace tamblo::test
