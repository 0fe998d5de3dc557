#include "tests/service/RawClient.h"
#include "tests/service/ServiceProcess.h"

#include <gmock/gmock.h>
#include <nlohmann/json.hpp>

#include <algorithm>
#include <csignal>
#include <memory>
#include <string>
#include <vector>

#include <poll.h>
#include <sys/resource.h>
#include <sys/socket.h>

// What clients and the machine can do wrong, and that nobody else notices.

namespace tamblo::test {
namespace {

using testing::HasSubstr;

/// A client that was there before the fault and must still be served after it.
class Bystander {
public:
    explicit Bystander(ServiceProcess& service) : client_(service.socketPath()) {
        client_.startSession(1000);
    }
    ~Bystander() { EXPECT_EQ(client_.call(Method::getServiceNameForReporterID, 1000)->result, Value(2)); }

private:
    RawClient client_;
};

std::function<void()> limited(__rlimit_resource resource, rlim_t soft, rlim_t hard) {
    return [resource, limit = rlimit{soft, hard}] { ::setrlimit(resource, &limit); };
}

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

TEST(Fault, BytesThatAreNoCborEndOnlyTheirConnection) {
    ServiceProcess service;
    const Bystander bystander(service);
    RawClient client(service.socketPath());
    client.startSession();
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
        std::string frames;
        std::uint64_t id = 0;
        // The start hands what follows it to another thread, which has the message's events to write.
        for (const wire::Request& next :
             {request(Method::createReportingSession, 7), request(Method::startReportingSessionForID, 7),
              message({{"n", round}}), request(Method::stopReportingSessionForID, 7)}) {
            frames += framesOf(next, 1, ++id);
        }
        client.sendBytes(frames + std::string("\x01\x00\x00\x00\x1C", 5));
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
    modest.startSession();
    EXPECT_FALSE(modest.call(message({{"k", std::string(wire::kMaximumFrameBytes - 100, 'x')}}))->error);
    EXPECT_EQ(service.countEvents("Playback.Start"), 2U);
}

TEST(Fault, RefusedRequestLeavesTheConnectionAlone) {
    ServiceProcess service;
    RawClient client(service.socketPath());
    client.startSession();
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
    EXPECT_FALSE(client.call(message({{"n", 1}}))->error);
    EXPECT_EQ(service.countEvents("Playback.Start"), 2U);
}

TEST(Fault, FloodIsCarriedOutInFull) {
    ServiceProcess service({.environment = {{"TAMBLO_LOG", "error"}}});
    const Bystander bystander(service);
    RawClient client(service.socketPath());
    client.startSession();
    constexpr int kMessages = 20'000;
    for (int i = 0; i < kMessages; ++i) {
        ASSERT_TRUE(client.send(message({{"n", i}})));
    }
    EXPECT_TRUE(client.call(Method::reporterID, 7));
    EXPECT_EQ(service.countEvents("Playback.Start"), 2U * kMessages);
}

TEST(Fault, AQueueThatWaitsHoldsSendersBackAndServesThemInFull) {
    ServiceProcess service(
        {.isInternalBuild = true,
         .preferences = {{kCaptures, R"({"enable_stackburst": true, "io_cycle": {}, "wait_time": 1.5e6})"}},
         .environment = {{"TAMBLO_LOG", "error"}}});
    RawClient client(service.socketPath());
    client.startSession();
    const auto waits = [&client] { return client.staysSilent(); };
    client.sendBytes(framesOf(message({{"smallest_buffer_frame_size", 512}}, {7}, 7, 6), 1, 99));

    // Many small requests, and few large ones, each more than the service may keep waiting.
    constexpr std::size_t kSmall = 20'000, kLarge = 16;
    const std::string small = framesOf(request(Method::getAllReporters), kSmall);
    const std::string large = framesOf(message({{"k", std::string(1'000'000, 'x')}}, {12345}), kLarge);
    RawClient manySmall(service.socketPath()), fewLarge(service.socketPath());
    const std::size_t smallTaken = acceptedOf(manySmall, small);
    const std::size_t largeTaken = acceptedOf(fewLarge, large);
    EXPECT_LT(smallTaken, small.size());
    EXPECT_LT(largeTaken, 8'000'000U);
    // What no session has to do with is answered meanwhile.
    RawClient other(service.socketPath());
    ASSERT_TRUE(other.sendItem(std::string_view("\x84\x00\x01\x63xyz\x80", 8)));
    EXPECT_TRUE(other.receive());
    EXPECT_TRUE(waits()) << "the machine was too slow to tell";

    EXPECT_EQ(client.receive()->id, 99U);
    EXPECT_EQ(contentOf(service.runtimeDirectory() + "/notifications/com.vandra.tamblo.dropped-stackburst"),
              "0\n");
    EXPECT_THAT(service.errorOutput(), HasSubstr("io_cycle: a dictionary in place of a number"));
    for (auto [sender, rest, count] :
         {std::tuple(&manySmall, std::string_view(small).substr(smallTaken), kSmall),
          std::tuple(&fewLarge, std::string_view(large).substr(largeTaken), kLarge)}) {
        EXPECT_TRUE(sender->sendBytes(rest));
        ::shutdown(sender->descriptor(), SHUT_WR);
        EXPECT_EQ(sender->receiveAll(), count);
    }
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
    ServiceProcess service({.environment = {{"TAMBLO_LOG", "error"}}});
    const Bystander bystander(service);
    RawClient client(service.socketPath());
    constexpr int kSessions = 10'000;
    for (int i = 0; i < kSessions; ++i) {
        client.send(request(Method::createReportingSession, 1'000'000'000'000 + i));
    }
    ASSERT_TRUE(client.call(Method::reporterID, 7));
    // Some thousand requests that arrive with one read, whose answers take half a gigabyte.
    const std::string frames = framesOf(request(Method::getAllReporters), 6'000);
    service.signal(SIGSTOP);
    client.sendBytes(frames);
    service.signal(SIGCONT);
    EXPECT_TRUE(client.isClosedByService());
    const std::string status = contentOf("/proc/" + std::to_string(service.pid()) + "/status");
    // 30 MB as it is built to be shipped; sanitizers hold back what was freed.
    EXPECT_LT(std::stoul(status.substr(status.find("VmHWM:") + 6)), 450'000U) << "kilobytes";
}

TEST(Fault, AcceptingGoesOnAfterTheDescriptorsWereGone) {
    ServiceProcess service({.beforeExec = limited(RLIMIT_NOFILE, 32, 32)});
    const Bystander bystander(service);
    std::vector<std::unique_ptr<RawClient>> clients;
    for (int i = 0; i < 60; ++i) {
        clients.push_back(std::make_unique<RawClient>(service.socketPath()));
    }
    EXPECT_TRUE(service.awaitErrorOutput("accepting connections rests"));
    clients.erase(clients.begin(), clients.begin() + 50);
    EXPECT_TRUE(clients.back()->call(Method::getAllReporters));
    EXPECT_THAT(service.errorOutput(), HasSubstr("accepting connections again"));
}

TEST(Fault, AFullDiskCostsTheLinesOfItsTimeAndNothingElse) {
    constexpr rlim_t kRoom = 20'000;
    ServiceProcess service({.environment = {{"TAMBLO_LOG", "error"}},
                            .beforeExec = limited(RLIMIT_FSIZE, kRoom, RLIM_INFINITY)});
    const Bystander bystander(service);
    RawClient client(service.socketPath());
    client.startSession();
    int sent = 0;
    const auto send = [&](int messages) {
        for (int i = 0; i < messages; ++i) {
            const auto reply = client.call(message({{"n", 1000 + sent++}}));
            ASSERT_TRUE(reply && !reply->error);
        }
    };
    const auto file = service.logs() / "analytics-events.jsonl";
    send(200);
    const std::string full = contentOf(file);
    EXPECT_LE(full.size(), kRoom);
    EXPECT_TRUE(full.ends_with('\n'));
    const rlimit unlimited{RLIM_INFINITY, RLIM_INFINITY};
    ASSERT_EQ(::prlimit(service.pid(), RLIMIT_FSIZE, &unlimited, nullptr), 0);
    send(10);

    const std::vector<std::string> lines = linesOf(file);
    EXPECT_TRUE(std::ranges::all_of(lines, [](const auto& line) { return nlohmann::json::accept(line); }));
    const std::string said = service.errorOutput();
    EXPECT_EQ(countOf("analytics-events.jsonl: cannot write: ", said), 1U) << said;
    const std::size_t written = service.countEvents("\"n\":1");
    const std::string lost = std::to_string(2 * static_cast<std::size_t>(sent) - written);
    EXPECT_EQ(
        countOf("analytics-events.jsonl: it can be written again; " + lost + " records were lost\n", said),
        1U)
        << said;
    EXPECT_EQ(service.countEvents("\"n\":1209"), 2U);
}

TEST(Fault, APreferenceThatCannotBeStoredLeavesItsFileWhole) {
    constexpr rlim_t kRoom = 4096;
    const std::string preferences =
        R"({"TalvixInvalidXyBackOffSeconds":3600,"other":[")" + std::string(kRoom, 'x') + "\"]}\n";
    ServiceProcess service({.isInternalBuild = true,
                            .preferences = {{kCaptures, preferences}},
                            .environment = {{"TAMBLO_LOG", "error"}},
                            .beforeExec = limited(RLIMIT_FSIZE, kRoom, RLIM_INFINITY)});
    const auto file = service.preferenceFile(kCaptures);
    /// How many drafts there are after five seconds of a fault.
    const auto drafts = [&service] {
        RawClient client(service.socketPath());
        client.startSession();
        for (const double offset : {0.0, 5.1}) {
            EXPECT_TRUE(client.call(
                message({{"tvac_invalid_x", offset}, {"zrreporting_timestamp", 4e9 + offset}}, {7}, 14, 11)));
        }
        return linesOf(service.logs() / "bug-report-drafts.jsonl").size();
    };
    EXPECT_EQ(drafts(), 1U);
    EXPECT_EQ(contentOf(file), preferences);
    EXPECT_EQ(drafts(), 1U) << "the service itself knows";
    EXPECT_EQ(service.tambloctl("preference set " + std::string(kCaptures) + " a 1").status, 0);

    // Once there is room, the time of a draft is the device's: another run of the service keeps to it.
    service.stop();
    service.start();
    const rlimit unlimited{RLIM_INFINITY, RLIM_INFINITY};
    ASSERT_EQ(::prlimit(service.pid(), RLIMIT_FSIZE, &unlimited, nullptr), 0);
    EXPECT_EQ(drafts(), 2U);
    EXPECT_THAT(contentOf(file),
                testing::ContainsRegex(R"(^\{"TalvixInvalidXyBackOffSeconds":3600,)"
                                       R"("TalvixInvalidXyQLTlastRun":[0-9]{10}\.[0-9]+,"a":1,"other":\[")"));
    service.stop();
    service.start();
    EXPECT_EQ(drafts(), 2U);
    EXPECT_EQ(entriesOf(file.parent_path()), 1) << "nothing is left over";
}

} // namespace
} // namespace tamblo::test
