#include "tests/service/RawClient.h"
#include "tests/service/ServiceProcess.h"

#include <gtest/gtest.h>
#include <nlohmann/json.hpp>

#include <algorithm>
#include <csignal>
#include <memory>
#include <random>
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
    for (const std::string& item : {nullInside, std::string("\xA0"),
                                    std::string("\x84\x00\x05\x63"
                                                "fly\x80",
                                                8)}) {
        client.sendItem(item);
        const auto reply = client.receive();
        ASSERT_TRUE(reply && reply->error);
        EXPECT_EQ(reply->error->domain, wire::kProtocolErrorDomain);
        EXPECT_FALSE(reply->error->message.empty());
    }
    EXPECT_TRUE(service.events().empty());
    EXPECT_FALSE(client.call(message({{"n", 1}}, {7}))->error);
    EXPECT_EQ(service.events().size(), 2U);
}

TEST(Fault, RandomBytesDisturbNobody) {
    ServiceProcess service;
    const Bystander bystander(service);
    std::mt19937 random(1);
    for (int round = 0; round < 200; ++round) {
        RawClient client(service.socketPath());
        std::string bytes(random() % 400, '\0');
        for (char& byte : bytes) {
            byte = static_cast<char>(random());
        }
        if (round % 2 == 0) {
            client.sendItem(bytes);
        } else {
            client.sendBytes(bytes);
        }
    }
}

TEST(Fault, ClientThatDiesWithinAFrameIsCleanedUp) {
    ServiceProcess service;
    const Bystander bystander(service);
    {
        RawClient client(service.socketPath());
        startSession(client, 7);
        client.sendBytes(std::string("\x40\x00\x00\x00\x84\x00\x05", 7));
    }
    EXPECT_TRUE(eventually([&service] { return service.countEvents("zrreportingclientuptime") == 1; }));
    RawClient other(service.socketPath());
    EXPECT_EQ(other.call(request(Method::getAllReporters))->result, Value(Array{1000}));
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
    EXPECT_EQ(service.events().size(), 2U * kMessages);
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
    for (int i = 0; i < 20'000; ++i) {
        client.send(request(Method::createReportingSession, 1'000'000'000'000 + i));
    }
    ASSERT_TRUE(client.call(request(Method::reporterID, 7)));
    // Some thousand requests that arrive with one read, whose answers take most of a gigabyte.
    wire::Request reporters = request(Method::getAllReporters);
    reporters.id = 1;
    TextBuffer frames;
    for (int i = 0; i < 4'000; ++i) {
        ASSERT_TRUE(wire::appendRequestFrame(frames, reporters));
    }
    service.signal(SIGSTOP);
    client.sendBytes(frames.view());
    service.signal(SIGCONT);
    EXPECT_TRUE(client.isClosedByService());
    const std::string status = readFile("/proc/" + std::to_string(service.pid()) + "/status");
    EXPECT_LT(std::stoul(status.substr(status.find("VmHWM:") + 6)), 500'000U) << "kilobytes";
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

TEST(Fault, DiskThatIsFullIsOneLineAtEitherEnd) {
    ServiceProcess service({.environment = {}, .beforeExec = [] {
                                // The kernel refuses what would make a file longer, as a full disk does.
                                std::signal(SIGXFSZ, SIG_IGN);
                                const rlimit limit{20'000, RLIM_INFINITY};
                                ::setrlimit(RLIMIT_FSIZE, &limit);
                            }});
    const auto file = service.logs() / "analytics-events.jsonl";
    RawClient client(service.socketPath());
    startSession(client, 7);
    constexpr int kMessages = 200;
    for (int i = 0; i < kMessages; ++i) {
        ASSERT_FALSE(client.call(message({{"n", i}}, {7}))->error);
    }
    const std::size_t kept = service.events().size();
    EXPECT_LT(kept, 2U * kMessages);
    const rlimit unlimited{RLIM_INFINITY, RLIM_INFINITY};
    ASSERT_EQ(::prlimit(service.pid(), RLIMIT_FSIZE, &unlimited, nullptr), 0);
    client.call(message({{"n", kMessages}}, {7}));

    EXPECT_EQ(service.events().size(), kept + 2);
    for (const std::string& line : service.events()) {
        EXPECT_TRUE(nlohmann::json::accept(line)) << line;
    }
    const std::string said = service.errorOutput();
    std::size_t mentions = 0;
    for (auto at = said.find(file.string()); at != std::string::npos; at = said.find(file.string(), at + 1)) {
        ++mentions;
    }
    EXPECT_EQ(mentions, 2U) << said;
    EXPECT_NE(said.find(std::to_string(2U * kMessages - kept)), std::string::npos) << said;
}

TEST(Fault, SinkDirectoryThatIsGoneComesBack) {
    ServiceProcess service;
    RawClient client(service.socketPath());
    startSession(client, 7);
    client.call(message({{"n", 1}}, {7}));
    std::filesystem::rename(service.logs(), service.directory() / "away");
    EXPECT_TRUE(eventually([&] {
        client.call(message({{"n", 2}}, {7}));
        client.call(message({{"n", 3}}, {7}));
        return service.errorOutput().find("analytics-events.jsonl") != std::string::npos ||
               std::filesystem::exists(service.logs() / "analytics-events.jsonl");
    }));
    std::filesystem::create_directories(service.logs());
    client.call(message({{"n", 4}}, {7}));
    EXPECT_EQ(service.countEvents("\"n\":4"), 2U);
}

TEST(Fault, SinkIsRotatedBetweenLines) {
    ServiceProcess service;
    RawClient client(service.socketPath());
    startSession(client, 7);
    const std::string large(900'000, 'x');
    for (int i = 0; i < 45; ++i) {
        client.call(message({{"n", i}, {"large", large}}, {7}));
    }
    EXPECT_LE(std::filesystem::file_size(service.logs() / "analytics-events.jsonl.1"), 64U << 20U);
    const std::vector<std::string> lines = service.events();
    ASSERT_EQ(lines.size(), 90U);
    for (std::size_t i = 0; i < lines.size(); ++i) {
        EXPECT_NE(lines[i].find("\"n\":" + std::to_string(i / 2) + ","), std::string::npos);
    }
}

} // namespace
} // namespace tamblo::test
