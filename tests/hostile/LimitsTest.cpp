#include "tests/hostile/HostileTest.h"

#include <list>
#include <tuple>

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
        Refused{"bytes_of_keys",
                64,
                {message({{std::string(64, 'k'), 1}})},
                message({{std::string(40, 'k'), 1}, {std::string(40, 'l'), 1}})},
        Refused{"delivered_bytes_of_message",
                40'000,
                {message({{"a", std::string(9'000, 'x')}}, {7, 7, 7, 7})},
                message({{"a", std::string(11'000, 'x')}}, {7, 7, 7, 7})},
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
        Refused{"decoded_bytes_of_frame", 4 << 20, {}, arrays(900'000)},
        Refused{"application_name_bytes", 512, {}, configuration("HostApplicationDisplayID", 900'000)}),
    [](const auto& test) { return test.param.limit + "_" + std::to_string(test.index); });

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

/// A limit, its value, and how many clients ask for how many replies of 10 kB each.
using Unread = std::tuple<std::string, std::size_t, int, std::size_t>;

class RepliesThatNobodyReads : public Hostile, public testing::WithParamInterface<Unread> {};

TEST_P(RepliesThatNobodyReads, EndTheirConnection) {
    const auto& [limit, value, clients, requests] = GetParam();
    ServiceProcess& service = start("\"" + limit + "\": " + std::to_string(value));
    RawClient owner(service.socketPath()), reader(service.socketPath());
    ASSERT_TRUE(callAll(owner, messages(1'000, [](std::size_t i) {
                            return creation(1'000'000'000'000 + static_cast<std::int64_t>(i));
                        })));
    std::list<RawClient> others;
    for (int i = 0; i < clients; ++i) {
        others.emplace_back(service.socketPath());
    }
    // All that is asked for comes with one read, also of somebody who reads the replies.
    service.signal(SIGSTOP);
    for (RawClient& other : others) {
        other.send(framesOf(request(Method::getAllReporters), 1, requests));
    }
    const std::size_t asked = std::min<std::size_t>(requests, 60);
    reader.send(framesOf(request(Method::getAllReporters), 1, asked));
    service.signal(SIGCONT);
    for (std::size_t i = 0; i < asked; ++i) {
        ASSERT_THAT(reader.receive(), IsDone());
    }
    ASSERT_TRUE(eventually([&] { return countOf(limit + ": at most", service.errorOutput()) > 0; }))
        << service.errorOutput();
    EXPECT_TRUE(eventually([&] { return std::ranges::any_of(others, &RawClient::isHungUp); }));
    if (kMemoryIsThatOfTheService) {
        EXPECT_LT(peakBytes(), 32U << 20U);
    }
}

INSTANTIATE_TEST_SUITE_P(Hostile, RepliesThatNobodyReads,
                         testing::Values(Unread{"reply_bytes", 100'000, 1, 500},
                                         Unread{"reply_bytes", 4U << 20U, 1, 6'000},
                                         Unread{"reply_bytes_of_user", 1'000'000, 6, 60},
                                         Unread{"reply_bytes_of_user", 180'000, 6, 30}),
                         [](const auto& test) {
                             return std::get<0>(test.param) + std::to_string(test.index);
                         });

/// A limit and its value.
using Bound = std::pair<std::string, int>;

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

class WaitingRequests : public Hostile, public testing::WithParamInterface<Bound> {};

TEST_P(WaitingRequests, HoldTheirSendersBackAndAreCarriedOutInFull) {
    ServiceProcess& service =
        start("\"" + GetParam().first + "\": " + std::to_string(GetParam().second),
              {.isInternalBuild = true,
               .preferences = {{kCaptures, R"({"enable_stackburst": true, "wait_time": 3e6})"}},
               .environment = {{"TAMBLO_LOG", "error"}}});
    Session client(service.socketPath());
    std::list<Session> senders;
    for (const std::int64_t id : {8, 9}) {
        senders.emplace_back(service.socketPath(), id);
    }
    RawClient other(service.socketPath());
    client.send(framesOf(message({{"smallest_buffer_frame_size", 512}}, {7}, 7, 6), 99));
    constexpr std::size_t kRequests = 300; // of which fewer may wait, though not as they are shipped
    // Errors, which are recorded however often they are said.
    const std::string all = framesOf(message({{"k", std::string(10'000, 'x')}}, {8}, 4, 6), 1, kRequests);
    std::vector<std::size_t> taken;
    for (const Session& sender : senders) {
        taken.push_back(acceptedOf(sender, all));
    }
    EXPECT_LT(taken[0] + taken[1], all.size());
    // What no session has to do with is answered meanwhile, unless it is the user who has to wait.
    other.send(std::string("\x08\0\0\0\x84\0\x01\x63xyz\x80", 12));
    EXPECT_EQ(other.isReadable(100), GetParam().first != "waiting_bytes_of_user");
    EXPECT_FALSE(client.isReadable(0)) << "the machine was too slow to tell";

    EXPECT_EQ(client.receive()->id, 99U);
    for (Session& sender : senders) {
        EXPECT_TRUE(sender.send(all.substr(taken[&sender == &senders.back()])));
        for (std::size_t i = 0; i < kRequests; ++i) {
            ASSERT_THAT(sender.receive(), IsDone());
        }
    }
    EXPECT_EQ(service.countEvents("\"k\":"), 2 * 2 * kRequests);
}

INSTANTIATE_TEST_SUITE_P(Hostile, WaitingRequests,
                         testing::Values(Bound{"waiting_requests", 20}, Bound{"waiting_bytes", 200'000},
                                         Bound{"waiting_bytes_of_user", 200'000}),
                         [](const auto& test) { return test.param.first; });

class RetainedBytes : public Hostile, public testing::WithParamInterface<Bound> {};

TEST_P(RetainedBytes, LetGoOfTheLargestSessionsOldestMessages) {
    ServiceProcess& service = start("\"" + GetParam().first + "\": " + std::to_string(GetParam().second));
    Session client(service.socketPath(), 7, 11);
    client.start(8, 11);
    constexpr std::size_t kMessages = 2'000;
    const std::string text(1'000, 'x');
    for (const auto& [id, count] : {std::pair(8, std::size_t{50}), {7, kMessages}}) {
        ASSERT_TRUE(callAll(client, messages(count, [&](std::size_t i) {
                                return message({{"n", 10'000 + i}, {"text", text}}, {id});
                            })));
    }
    EXPECT_TRUE(client.stop(8) && client.stop(7));
    EXPECT_EQ(service.countEvents("\"n\":"), 2 * (kMessages + 50));
    EXPECT_EQ(countOf(GetParam().first + " is reached", service.errorOutput()), 1U);
    const auto retained = [&service](const std::string& id) {
        return run("cat " + (service.logs() / "DiagnosticLogs/Audio/Reporting/*-").string() + id + "-*")
            .output;
    };
    const std::string all = retained("7");
    EXPECT_EQ(countOf("\"n\":", retained("8")), 50U);
    EXPECT_EQ(countOf("\"n\": 10000,", all), 0U);
    EXPECT_EQ(countOf("\"n\": 11999,", all), 1U);
    // The record of its start went, too.
    const std::size_t letGo = kMessages - countOf("\"n\":", all);
    EXPECT_GT(letGo, kMessages / 4);
    std::string told;
    while (told.find("let go") == told.npos && !(told = service.told()).empty()) {
    }
    EXPECT_THAT(told, testing::HasSubstr(", " + std::to_string(letGo + 1) + " retained records let go"));
    if (kMemoryIsThatOfTheService) {
        EXPECT_LT(peakBytes(), 16U << 20U);
    }
}

INSTANTIATE_TEST_SUITE_P(Hostile, RetainedBytes,
                         testing::Values(Bound{"retained_bytes_of_user", 1'000'000},
                                         Bound{"retained_bytes", 1'000'000}),
                         [](const auto& test) { return test.param.first; });

TEST_F(Hostile, KeysBeyondThoseThatAreRememberedAreRecordedAllTheSame) {
    ServiceProcess& service = start("\"previous_keys_of_session\": 100");
    Session client(service.socketPath());
    ASSERT_TRUE(callAll(client, messages(300, [](std::size_t i) {
                            return message({{"key" + std::to_string(i), 1}});
                        })));
    EXPECT_EQ(service.countEvents("\"key"), 2 * 300U);
    EXPECT_EQ(countOf("more than 100 different keys", service.errorOutput()), 1U);
}

TEST_F(Hostile, ReportsAreKeptWithinAgeNumberAndBytes) {
    ServiceProcess& service = start("\"report_files\": 3, \"report_bytes\": 40000");
    const auto reports = service.logs() / "DiagnosticLogs/Audio/Reporting";
    const auto old = reports / "20200101-120000+0000-1-app-test.json";
    writeFile(old, "[]");
    writeFile(reports / "notes.json", "somebody's");
    std::filesystem::last_write_time(old,
                                     std::filesystem::file_time_type::clock::now() - std::chrono::days(15));
    Session client(service.socketPath());
    for (std::int64_t id = 1; id <= 8; ++id) {
        client.start(id, 11);
        EXPECT_THAT(client.call(message({{"text", std::string(id <= 4 ? 10 : 15'000, 'x')}}, {id})),
                    IsDone());
        EXPECT_TRUE(client.stop(id));
        EXPECT_EQ(entriesOf(reports), 1 + std::min<std::ptrdiff_t>(id, id <= 6 ? 3 : 2)) << id;
        EXPECT_EQ(run("ls " + (reports / ("*-" + std::to_string(id) + "-*")).string()).status, 0) << id;
    }
    EXPECT_FALSE(std::filesystem::exists(old));
    EXPECT_EQ(contentOf(reports / "notes.json"), "somebody's");
}

} // namespace
} // namespace tamblo::test
