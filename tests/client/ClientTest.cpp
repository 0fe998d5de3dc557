#include "client/Client.h"

#include "tests/base/AllocationCount.h"
#include "tests/client/FakeService.h"

#include <gmock/gmock.h>

extern "C" int runCProgram(const char* socketPath);

namespace tamblo::client {
namespace {

using namespace std::chrono_literals;
using test::FakeService;
using wire::Method;

constexpr EventCategory kVolume = category(EventKind::volume);
constexpr std::int64_t kSeven[] = {7};

/// Of an error of the library's own; waits for it.
template <typename T> ErrorCode codeOf(Client& client, std::future<Result<T>>&& future) {
    if (!client.wait(future, 5s)) {
        return {};
    }
    const std::optional<Error> error = future.get().error;
    return error && error->domain == kErrorDomain ? static_cast<ErrorCode>(error->code) : ErrorCode{};
}

Client::Options pumpedBy(const FakeService& service) {
    return {.socketPath = service.path(), .threading = Client::Threading::caller};
}

class ClientInBothModes : public ::testing::TestWithParam<Client::Threading> {
protected:
    [[nodiscard]] Client::Options options(StateFunction onState = {}, std::size_t capacity = 1024) const {
        return {.socketPath = service.path(),
                .threading = GetParam(),
                .queueCapacity = capacity,
                .onState = std::move(onState)};
    }
    FakeService service;
};
INSTANTIATE_TEST_SUITE_P(, ClientInBothModes,
                         ::testing::Values(Client::Threading::background, Client::Threading::caller));

TEST_P(ClientInBothModes, PendingRequestsFailWhenTheServiceGoesAndSessionsAreRemadeBeforeWhatWaits) {
    std::string trace;
    Client* sender = nullptr;
    std::atomic<bool> isArmed{false};
    Client client(options([&](ConnectionState state) {
        trace += "CLR"[static_cast<std::size_t>(state)];
        if (state == ConnectionState::connected && isArmed) {
            sender->createReportingSession(7, nullptr);
            sender->startReportingSessionForID(7, nullptr);
        }
    }));
    sender = &client;
    auto held = client.startReportingSessionForID(7);
    auto ready = client.createReportingSession(7);
    ASSERT_TRUE(client.wait(ready, 5s));
    isArmed = true;

    service.stop();
    EXPECT_EQ(codeOf(client, std::move(held)), ErrorCode::connectionLost);
    auto waiting = client.sendMessage({{"n", 1}}, kVolume, EventType::generic, kSeven);
    EXPECT_FALSE(client.wait(waiting, 150ms));

    service.start();
    ASSERT_TRUE(client.wait(waiting, 5s));
    EXPECT_TRUE(waiting.get().ok());
    const Method sent[] = {Method::startReportingSessionForID, Method::createReportingSession,
                           Method::createReportingSession, Method::startReportingSessionForID,
                           Method::sendMessage};
    EXPECT_TRUE(std::ranges::equal(service.requests(), sent, {}, &wire::Request::method));
    EXPECT_THAT(trace, testing::MatchesRegex("R*CLR+C")) << "connected, lost, reconnecting";
}

TEST_P(ClientInBothModes, AFullQueueRefusesAndCountsWithoutBlocking) {
    service.isDeaf = true;
    Client client(options({}, 8));
    const Dictionary payload{{"text", std::string(4000, 'x')}};
    std::size_t accepted = 0;
    for (int i = 0; i < 1000; ++i) {
        accepted += client.post(payload, kVolume, EventType::generic, {7}) ? 1 : 0;
        if (i % 100 == 0 && GetParam() == Client::Threading::caller) {
            client.run(0ms);
        }
    }
    EXPECT_EQ(client.refusedMessages(), 1000 - accepted);
    EXPECT_GT(client.refusedMessages(), 500U);
    std::future<Result<Nothing>> refused;
    for (int i = 0; i < 1000 && (!refused.valid() || !client.wait(refused, 0ms)); ++i) {
        refused = client.sendMessage(payload, kVolume, EventType::generic, {});
    }
    EXPECT_EQ(codeOf(client, std::move(refused)), ErrorCode::refused);
    service.isDeaf = false;
    EXPECT_TRUE(client.flush(5s));
    EXPECT_TRUE(service.waitForRequests(accepted));
}

TEST_P(ClientInBothModes, FramesOfEverySizeArriveAndOnesOverTheLimitAreRefusedHere) {
    Client client(options());
    std::future<Result<Nothing>> last;
    for (const std::size_t size : {0U, 900U, 1024U, 5000U, 300000U, 1048000U}) {
        last = client.sendMessage({{"text", std::string(size, 'x')}}, kVolume, EventType::generic, {});
    }
    const std::string tooLong(1048577, 'x');
    EXPECT_FALSE(client.post({{"text", tooLong}}, kVolume, EventType::generic));
    EXPECT_FALSE(client.message().set("text", tooLong).send(kVolume, EventType::stop, kSeven));
    EXPECT_EQ(client.refusedMessages(), 2U);
    ASSERT_TRUE(client.wait(last, 5s));
    EXPECT_TRUE(last.get().ok());
    const auto requests = service.requests();
    ASSERT_EQ(requests.size(), 6U);
    EXPECT_EQ(requests[4].dictionary.find("text")->stringValue().size(), 300000U);
}

TEST_P(ClientInBothModes, SendingAllocatesNothingAndTheEndSendsWhatIsQueuedAndAnswersWhatWaits) {
    const Dictionary payload{{"name", std::string(300, 'x')}, {"volume", 0.5}};
    std::atomic<int> replies = 0;
    std::future<Result<bool>> held;
    {
        Client client(options());
        auto ready = client.createReportingSession(7);
        ASSERT_TRUE(client.wait(ready, 5s));
        held = client.startReportingSessionForID(7);
        const auto spent = test::allocationsOf([&] {
            client.post(payload, kVolume, EventType::generic, kSeven);
            client.sendMessage(payload, kVolume, EventType::generic, kSeven, [&](auto&&) { ++replies; });
            client.message().set("name", "text").set("volume", 0.5).send(kVolume, EventType::generic, kSeven);
        });
        EXPECT_EQ(spent.blocks, 0U) << "on the calling thread";
    }
    EXPECT_EQ(replies, 1);
    EXPECT_EQ(held.get().error->code, static_cast<std::int64_t>(ErrorCode::closed));
    EXPECT_TRUE(service.waitForRequests(5));
    service.stop();
    {
        Client client(options());
        held = client.createReportingSession(7);
    }
    EXPECT_EQ(held.get().error->code, static_cast<std::int64_t>(ErrorCode::closed)) << "never sent";
}

TEST(Client, SecondRepliesAreDroppedUnlessAskedForAndStrangeOnesHarmNothing) {
    FakeService service([](const wire::Request& request, TextBuffer& replies) {
        wire::appendBooleanReply(replies, 12345, true);
        wire::appendErrorReply(replies, 0, {"com.vandra.tamblo.protocol", -32700, ""});
        FakeService::answer(request, replies);
        FakeService::answer(request, replies);
    });
    Client client(pumpedBy(service));
    int first = 0, every = 0;
    client.getServiceNameForReporterID(0, [&](auto&& reply) { first += reply.ok() ? 1 : 100; });
    client.getServiceNameForReporterID(
        0, [&](auto&& reply) { every += reply.ok() ? 1 : 100; }, Replies::every);
    auto held = client.startReportingSessionForID(7);
    auto state = client.reporterID(1);
    auto all = client.getAllReporters();
    ASSERT_TRUE(client.wait(all, 5s));
    EXPECT_EQ(state.get().value, (Dictionary{{"reporterID", 1}}));
    EXPECT_EQ(all.get().value, (std::vector<std::int64_t>{7, -8}));
    EXPECT_EQ(every, 2);
    service.stop();
    EXPECT_EQ(codeOf(client, std::move(held)), ErrorCode::connectionLost);
    EXPECT_EQ(every, 102);
    EXPECT_EQ(first, 1);
}

TEST(Client, WhatIsNotAnsweredAsItShouldBeIsAnError) {
    FakeService service([](const wire::Request& request, TextBuffer& replies) {
        if (request.method == Method::sendMessage) {
            wire::appendErrorReply(replies, *request.id, {"com.vandra.audio.reporting", 1, "off"});
        } else if (request.method == Method::createReportingSession) {
            wire::appendUnsignedReply(replies, *request.id, 3);
        } else {
            wire::appendNullReply(replies, *request.id);
        }
    });
    Client client(pumpedBy(service));
    EXPECT_EQ(codeOf(client, client.createReportingSession(7)), ErrorCode::unexpectedReply);
    EXPECT_EQ(codeOf(client, client.getServiceNameForReporterID(7)), ErrorCode::unexpectedReply);
    EXPECT_EQ(codeOf(client, client.reporterID(7)), ErrorCode::unexpectedReply);
    EXPECT_EQ(codeOf(client, client.getAllReporters()), ErrorCode::unexpectedReply);
    auto disabled = client.sendMessage({}, kVolume, EventType::generic, {});
    ASSERT_TRUE(client.wait(disabled, 5s));
    const auto error = disabled.get().error;
    EXPECT_EQ(error->domain + " " + std::to_string(error->code) + " " + error->message,
              "com.vandra.audio.reporting 1 off");

    Client absent({.socketPath = "/nonexistent", .threading = Client::Threading::caller, .reconnect = false});
    EXPECT_FALSE(absent.connect());
    EXPECT_EQ(codeOf(absent, absent.createReportingSession(7)), ErrorCode::connectionLost);
}

TEST(Client, AFrameCutShortByTheEndOfAConnectionIsSentAgainInFull) {
    FakeService service;
    service.isDeaf = true;
    Client client(pumpedBy(service));
    const Dictionary payload{{"text", std::string(900000, 'x')}};
    auto first = client.sendMessage(payload, kVolume, EventType::generic, {});
    auto second = client.sendMessage({{"n", 2}}, kVolume, EventType::generic, {});
    EXPECT_FALSE(client.wait(second, 20ms));
    service.stop();
    service.isDeaf = false;
    service.start();
    ASSERT_TRUE(client.wait(second, 5s));
    EXPECT_TRUE(first.get().ok() && second.get().ok());
    ASSERT_EQ(service.requests().size(), 2U);
    EXPECT_EQ(service.requests()[0].dictionary, payload);
}

TEST(Client, MessagesOfOneThreadKeepTheirOrderAndManyThreadsLoseNone) {
    FakeService service;
    constexpr int kThreads = 4, kMessages = 2000;
    Client client({.socketPath = service.path(), .queueCapacity = 256});
    std::vector<std::jthread> threads;
    for (int thread = 0; thread < kThreads; ++thread) {
        threads.emplace_back([&client, thread] {
            const std::int64_t reporters[] = {thread};
            for (int i = 0; i < kMessages; ++i) {
                const auto send = [&] {
                    return i % 2 == 0 ? client.post({{"n", i}}, kVolume, EventType::generic, reporters)
                                      : client.message().set("n", i).send(kVolume, {}, reporters);
                };
                while (!send()) {
                    std::this_thread::sleep_for(100us);
                }
            }
        });
    }
    threads.clear();
    ASSERT_TRUE(client.flush(10min));
    ASSERT_TRUE(service.waitForRequests(kThreads * kMessages));
    int next[kThreads] = {};
    for (const wire::Request& request : service.requests()) {
        ASSERT_EQ(request.dictionary.find("n")->integerValue(), next[request.reporterIDs.at(0)]++);
    }
}

TEST(MessageWriter, WritesWhatTheServiceReadsAndNothingWhenDropped) {
    FakeService service;
    Client client(pumpedBy(service));
    client.message().set("lost", 1);
    MessageWriter writer = client.message();
    writer.set("text", std::string("a")).set("on", true).set("float", 0.5F).set("when", Value::date(3));
    Dictionary expected{{"text", "a"}, {"on", true}, {"float", 0.5F}, {"when", Value::date(3)}};
    for (int i = 0; i < 300; ++i) {
        writer.set(std::to_string(i), i);
        expected.set(std::to_string(i), i);
    }
    EXPECT_TRUE(writer.send(kVolume, EventType::stop, kSeven));
    ASSERT_TRUE(client.flush(5s) && service.waitForRequests(1));
    const wire::Request request = service.requests().at(0);
    EXPECT_EQ(request.dictionary, expected);
    EXPECT_TRUE(request.category == 14U && request.type == 2);
    EXPECT_EQ(request.reporterIDs, std::vector<std::int64_t>{7});
}

TEST(CApi, ACProgramRunsASessionAndItsPayloadArrivesAsItWasBuilt) {
    FakeService service;
    EXPECT_EQ(runCProgram(service.path().c_str()), 0);
    ASSERT_TRUE(service.waitForRequests(12));
    const std::uint8_t bytes[] = {0, 1, 255};
    const Dictionary expected{
        {"string", "text"},
        {"int", -5},
        {"uint", ~std::uint64_t{0}},
        {"double", 0.1},
        {"float", 0.5F},
        {"bool", true},
        {"date", Value::date(1.5)},
        {"data", Value::data(bytes)},
        {"inner", Dictionary{{"ints", Array{7}}, {"doubles", Array{0.5}}, {"strings", Array{"a", "b"}}}}};
    auto requests = service.requests();
    requests.erase(requests.begin()); // the start of the client that only waits
    EXPECT_EQ(requests[2].serviceType, 7);
    EXPECT_EQ(requests[3].dictionary, expected);
    EXPECT_EQ(requests[5].dictionary.find("float")->kind(), Value::Kind::singleFloat);
    EXPECT_EQ(requests[5].category, 0x08000004U);
    EXPECT_EQ(requests[5].reporterIDs, std::vector<std::int64_t>{7});
    EXPECT_TRUE(requests[6].reporterIDs.empty());
    EXPECT_FALSE(requests[6].id);
    EXPECT_TRUE(requests[7].dictionary.empty()) << "no payload";
}

} // namespace
} // namespace tamblo::client
