#include "tests/hostile/HostileTest.h"

#include <list>

// Each limit, lowered: what is within it is done, what is beyond it is refused by name, and nothing else is
// lost.

namespace tamblo::test {
namespace {

/// The requests of one client with session 7, of which only the last one is beyond the limit.
struct Refused {
    std::string limit;
    int value;
    std::vector<wire::Request> within;
    wire::Request beyond;

    friend void PrintTo(const Refused& row, std::ostream* out) { *out << row.limit; }
};

wire::Request configuration(std::string key, std::size_t bytes, std::int64_t reporterID = 7) {
    return {.method = Method::setConfiguration,
            .reporterID = reporterID,
            .dictionary = {{std::move(key), std::string(bytes, 'x')}}};
}
wire::Request creation(std::int64_t reporterID) {
    return request(Method::createReportingSession, reporterID);
}
Dictionary entries(std::size_t count) {
    Dictionary made;
    for (std::size_t i = 0; i < count; ++i) {
        made.set("entry" + std::to_string(i), i);
    }
    return made;
}
wire::Request arrays(std::size_t count) {
    return message({{"arrays", Value(std::vector<Value>(count, Value(std::vector<Value>())))}});
}

class RequestLimits : public Hostile, public testing::WithParamInterface<Refused> {};

TEST_P(RequestLimits, RefuseByName) {
    const Refused& row = GetParam();
    // The bystander has a connection and a session of its own, which count to the user's.
    ServiceProcess& service = start("\"" + row.limit + "\": " + std::to_string(row.value));
    Session client(service.socketPath());
    for (const wire::Request& each : row.within) {
        EXPECT_THAT(client.call(each), IsDone());
    }
    const std::size_t recorded = service.countEvents("Playback.Start");
    EXPECT_THAT(client.call(row.beyond), RefusesBy(row.limit));
    EXPECT_THAT(client.call(row.beyond), RefusesBy(row.limit));
    // The connection goes on, the log has told once of whom, and nothing of it was recorded.
    EXPECT_THAT(client.call(message({{"small", 1}})), IsDone());
    EXPECT_EQ(service.countEvents("Playback.Start"), recorded + 2);
    const std::string log = service.errorOutput();
    EXPECT_EQ(countOf(row.limit, log), 1U) << log;
    EXPECT_THAT(log, testing::ContainsRegex(std::to_string(::getpid()) + "[^\n]*" + row.limit + "|" +
                                            row.limit + "[^\n]*" + std::to_string(::getpid())));
}

INSTANTIATE_TEST_SUITE_P(
    Hostile, RequestLimits,
    testing::Values(
        Refused{"reporters_of_message", 4, {message({{"n", 1}}, {7, 7, 7, 7})}, message({}, {7, 7, 7, 7, 7})},
        Refused{"entries_of_dictionary", 8, {message(entries(8))}, message(entries(9))},
        Refused{"entries_of_dictionary", 8, {message({{"in", entries(7)}})}, message({{"in", entries(8)}})},
        Refused{"entries_of_dictionary",
                8,
                {},
                {.method = Method::setConfiguration, .reporterID = 7, .dictionary = entries(9)}},
        Refused{
            "key_bytes", 64, {message({{std::string(64, 'k'), 1}})}, message({{std::string(65, 'k'), 1}})},
        Refused{"decoded_bytes_of_frame", 1 << 17, {arrays(500)}, arrays(20'000)},
        Refused{"application_name_bytes",
                32,
                {configuration("HostApplicationDisplayID", 32)},
                configuration("HostApplicationDisplayID", 33)},
        Refused{"configuration_bytes_of_session",
                4'096,
                {configuration("a", 1'500), configuration("a", 1'600), configuration("b", 1'500)},
                configuration("c", 1'500)},
        Refused{"configuration_bytes_of_user",
                8'192,
                {creation(8), configuration("a", 3'000), configuration("a", 3'000, 8)},
                configuration("b", 3'000)},
        Refused{"sessions_of_connection", 3, {creation(8), creation(9), creation(9)}, creation(10)},
        Refused{"sessions_of_user", 3, {creation(8)}, creation(9)},
        // As they are shipped, what has done harm.
        Refused{"reporters_of_message", 128, {}, message({}, std::vector<std::int64_t>(10'000, 7), 4, 6)},
        Refused{"entries_of_dictionary", 1'024, {message(entries(1'024))}, message(entries(1'100))},
        Refused{"decoded_bytes_of_frame", 4 << 20, {}, arrays(900'000)},
        Refused{"application_name_bytes", 512, {}, configuration("HostApplicationDisplayID", 900'000)}),
    [](const auto& test) { return test.param.limit + "_" + std::to_string(test.index); });

TEST_F(Hostile, SessionsThatAreGoneMakeRoom) {
    ServiceProcess& service = start("\"sessions_of_connection\": 3, \"sessions_of_user\": 4");
    RawClient client(service.socketPath());
    for (std::int64_t round = 0; round < 20; ++round) {
        RawClient other(service.socketPath());
        EXPECT_THAT(other.call(creation(50)), IsDone());
        for (const std::int64_t id : {1, 2}) {
            EXPECT_THAT(client.call(creation(10 * round + id)), IsDone());
        }
        EXPECT_THAT(client.call(creation(10 * round + 3)), RefusesBy("sessions_of_user"));
        for (const std::int64_t id : {1, 2}) {
            EXPECT_THAT(client.call(Method::destroyReportingSession, 10 * round + id), IsDone());
        }
        ::shutdown(other.descriptor(), SHUT_RDWR);
        EXPECT_TRUE(other.isClosedByService());
    }
}

TEST_F(Hostile, ConnectionsBeyondTheUsersAreToldSoAndEnd) {
    ServiceProcess& service = start("\"connections_of_user\": 6");
    std::list<RawClient> clients;
    for (int i = 0; i < 5; ++i) {
        EXPECT_THAT(clients.emplace_back(service.socketPath()).call(Method::getAllReporters), IsDone());
    }
    for (int i = 0; i < 3; ++i) {
        RawClient refused(service.socketPath());
        const auto reply = refused.receive();
        EXPECT_THAT(reply, RefusesBy("connections_of_user"));
        EXPECT_EQ(reply ? reply->id : 1, 0U);
        EXPECT_TRUE(refused.isClosedByService());
    }
    EXPECT_EQ(countOf("connections_of_user", service.errorOutput()), 1U);
    clients.clear();
    EXPECT_TRUE(eventually(
        [&] { return RawClient(service.socketPath()).call(Method::getAllReporters).has_value(); }));
}

TEST_F(Hostile, FramesThatDoNotGoOnEndTheirConnectionsByName) {
    ServiceProcess& service = start("\"unfinished_bytes_of_user\": 1000000, \"frame_seconds\": 1");
    const auto expectEnd = [](RawClient& client, std::string_view limit) {
        const auto reply = client.receive();
        EXPECT_THAT(reply, RefusesBy(limit));
        EXPECT_EQ(reply ? reply->id : 1, 0U);
        EXPECT_TRUE(client.isClosedByService());
    };
    // What fits for some of a user does not for all.
    const std::string unfinished = std::string("\x80\x38\x01\0", 4) + std::string(70'000, 'x');
    std::list<RawClient> clients;
    for (int i = 0; i < 16; ++i) {
        clients.emplace_back(service.socketPath()).send(unfinished);
        ASSERT_TRUE(bystanderIsServed());
    }
    expectEnd(clients.back(), "unfinished_bytes_of_user");
    EXPECT_FALSE(clients.front().isReadable(0));
    clients.erase(std::next(clients.begin()), clients.end());
    ASSERT_TRUE(bystanderIsServed());
    // One that goes on may take longer.
    RawClient slow(service.socketPath());
    const std::string frame = framesOf(request(Method::getAllReporters));
    for (const char byte : frame) {
        slow.send({&byte, 1});
        ::usleep(static_cast<useconds_t>(1'500'000 / frame.size()));
    }
    EXPECT_THAT(slow.receive(), IsDone());
    expectEnd(clients.front(), "frame_seconds");
}

TEST_F(Hostile, RepliesThatNobodyReadsEndTheirConnection) {
    ServiceProcess& service = start("\"reply_bytes\": 100000");
    RawClient owner(service.socketPath()), reader(service.socketPath()), other(service.socketPath());
    std::vector<wire::Request> creations;
    for (int i = 0; i < 1'000; ++i) {
        creations.push_back(creation(1'000'000'000'000 + i));
    }
    ASSERT_TRUE(callAll(owner, creations));
    // Half a megabyte of replies by one batch, for somebody who reads.
    reader.send(framesOf(request(Method::getAllReporters), 1, 60));
    for (int i = 0; i < 60; ++i) {
        ASSERT_THAT(reader.receive(), IsDone());
    }
    other.send(framesOf(request(Method::getAllReporters), 1, 500));
    EXPECT_TRUE(other.isHungUp());
    EXPECT_EQ(countOf("reply_bytes", service.errorOutput()), 1U);
}

TEST_F(Hostile, RetainedMessagesBeyondTheBudgetAreLetGoAndTold) {
    ServiceProcess& service = start("\"retained_bytes_of_user\": 1000000");
    Session client(service.socketPath());
    constexpr std::size_t kMessages = 2'000;
    std::vector<wire::Request> messages;
    for (std::size_t i = 0; i < kMessages; ++i) {
        messages.push_back(message({{"n", i}, {"text", std::string(1'000, 'x')}}));
    }
    ASSERT_TRUE(callAll(client, messages));
    EXPECT_TRUE(client.stop());
    EXPECT_EQ(service.countEvents("\"n\":"), 2 * kMessages);
    EXPECT_EQ(countOf("retained_bytes_of_user", service.errorOutput()), 1U);
    if (kMemoryIsThatOfTheService) {
        EXPECT_LT(peakBytes(), 16U << 20U);
    }
}

} // namespace
} // namespace tamblo::test
