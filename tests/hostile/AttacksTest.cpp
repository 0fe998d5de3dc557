#include "tests/hostile/HostileTest.h"

#include <algorithm>
#include <array>
#include <list>
#include <map>

#include <grp.h>

// What one client could do to the others, each at a small scale and with the limits as they are shipped. What
// it costs is asserted in bytes, lines, memory and shares of processor time, never in time by the clock.

namespace tamblo::test {
namespace {

TEST_F(Hostile, MessagesThatEachBringAKeyCostTheSameAtTheEnd) {
    ServiceProcess& service = start();
    Session client(service.socketPath());
    const auto costOf = [&](std::size_t first) {
        const auto batch = messages(2'000, [&](std::size_t i) {
            return message({{"key" + std::to_string(first + i), 1}});
        });
        return cpuSecondsOf([&] { EXPECT_TRUE(callAll(client, batch)); });
    };
    const double early = costOf(0);
    for (std::size_t first = 2'000; first < 16'000; first += 2'000) {
        costOf(first);
    }
    // Something else may happen to fall into one of them.
    EXPECT_LT(std::min(costOf(16'000), costOf(18'000)), 6 * early);
}

TEST_F(Hostile, KindsThatWouldCollideInATableCostWhatOthersDo) {
    ServiceProcess& service = start();
    Session client(service.socketPath(), 7, 11);
    const auto costOfStop = [&](std::uint64_t step) {
        client.start(7, 11);
        EXPECT_TRUE(callAll(client, messages(20'000, [&](std::uint64_t i) {
                                return message({}, {7}, static_cast<std::uint32_t>((i + 1) * step >> 16U),
                                               static_cast<std::uint16_t>((i + 1) * step));
                            })));
        return cpuSecondsOf([&] { client.call(Method::stopReportingSessionForID, 7); });
    };
    const double usual = costOfStop(20'755);
    // The size of a table of the standard library's that has so many entries.
    EXPECT_LT(costOfStop(20'753), 3 * usual);
}

TEST_F(Hostile, ListsThatNobodyAwaitsAreNotMade) {
    ServiceProcess& service = start();
    RawClient client(service.socketPath());
    ASSERT_TRUE(callAll(client, messages(10'000, [](std::size_t i) {
                            return request(Method::createReportingSession, static_cast<std::int64_t>(i + 1));
                        })));
    const std::vector<wire::Request> lists(300, request(Method::getAllReporters));
    TextBuffer unawaited;
    for (const wire::Request& list : lists) {
        ASSERT_TRUE(wire::appendRequestFrame(unawaited, list));
    }
    const double awaitedCost = cpuSecondsOf([&] { EXPECT_TRUE(callAll(client, lists)); });
    const double unawaitedCost = cpuSecondsOf([&] {
        client.send(unawaited.view());
        client.call(Method::reporterID, 1);
    });
    EXPECT_LT(unawaitedCost, awaitedCost / 4);
}

TEST_F(Hostile, UnfinishedFramesTakeBoundedMemory) {
    ServiceProcess& service = start();
    std::list<RawClient> clients;
    const std::string unfinished = std::string("\0\0\x10\0", 4) + std::string(1'000'000, 'x');
    for (int i = 0; i < 100; ++i) {
        clients.emplace_back(service.socketPath()).send(unfinished);
        ASSERT_TRUE(bystanderIsServed());
    }
    if (kMemoryIsThatOfTheService) {
        EXPECT_LT(peakBytes(), 48U << 20U);
    }
}

TEST_F(Hostile, LinesOfTheLogAreFewerThanWhatClientsDo) {
    ServiceProcess& service = start();
    RawClient client(service.socketPath());
    std::list<RawClient> idle;
    for (int i = 0; i < 100; ++i) {
        idle.emplace_back(service.socketPath());
    }
    ASSERT_THAT(idle.back().call(Method::getAllReporters), IsDone());
    ASSERT_TRUE(callAll(client, messages(100, [](std::size_t i) {
                            return message({{"n", i}}, std::vector<std::int64_t>(200, 12'345));
                        })));
    ASSERT_TRUE(callAll(client, messages(100, [](std::size_t i) { return message({{"n", i}}, {}); })));
    for (int i = 0; i < 300; ++i) {
        EXPECT_THAT(RawClient(service.socketPath()).call(Method::reporterID, 7), IsDone());
        client.send(std::string("\x01\0\0\0\xA0", 5));
        EXPECT_TRUE(client.receive());
    }
    EXPECT_LT(logLines(), 500U);
    EXPECT_LT(service.errorOutput().size(), 200'000U);
}

TEST_F(Hostile, WithoutDescriptorsWhatIsAnsweredIsInItsFileAndWhatIsForbiddenIsNot) {
    const std::string domain = "com.vandra.tamblo.analytics";
    ServiceProcess& service =
        start({}, {.preferences = {{domain, R"({"events_in_use": ["com.vandra.tamblo.Playback.Start"]})"}}});
    const std::filesystem::path sink = service.logs() / "analytics-events.jsonl";
    ASSERT_TRUE(bystanderIsServed());
    service.limit(RLIMIT_NOFILE, 40);
    std::list<RawClient> clients;
    for (int i = 0; i < 60; ++i) {
        clients.emplace_back(service.socketPath());
    }
    ASSERT_TRUE(
        eventually([&] { return countOf("accepting connections rests", service.errorOutput()) > 0; }));
    // The file is moved away, as a shipper does, and the preferences are written anew.
    const std::filesystem::path moved = service.logs() / "analytics-events.jsonl.moved";
    std::filesystem::rename(sink, moved);
    writeFile(service.preferenceFile(domain), R"({"events_in_use": ["com.vandra.tamblo.Playback.Start"] })");
    ::usleep(150'000); // after which the file's place is looked up again
    std::size_t answered = 0;
    for (int i = 0; i < 20; ++i) {
        answered += bystanderIsServed() ? 1U : 0U;
        (void)bystander_->call(message({{"forbidden", i}}, {kBystander}, 4, 2));
    }
    clients.erase(clients.begin(), std::prev(clients.end()));
    EXPECT_THAT(clients.back().call(Method::getAllReporters), IsDone());
    EXPECT_GT(countOf("accepting connections again", service.errorOutput()), 0U);
    const std::string lines = contentOf(moved) + contentOf(sink);
    EXPECT_EQ(countOf("\"bystander\":", lines), 1 + answered);
    EXPECT_EQ(countOf("\"forbidden\":", lines), 0U);
    EXPECT_EQ(answered, 20U);
}

TEST_F(Hostile, WhatIsNoRequestEndsItsConnectionOnceWhatCameBeforeIsAnsweredIfNothingCanFollow) {
    ServiceProcess& service = start({}, {.environment = {{"TAMBLO_LOG", "info"}}});
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
    EXPECT_EQ(service.countEvents("Playback.Start"), 2 * kRounds);
}

TEST_F(Hostile, NoThreadIsNoReasonToEnd) {
    // Root is not held to the limit on threads, so the service is somebody else's.
    constexpr uid_t kSomebody = 65'534;
    const auto becomeSomebody = [] {
        if (::geteuid() == 0) {
            const auto all = std::filesystem::path(::getenv("RUNTIME_DIRECTORY")).parent_path();
            (void)std::system(("chown -R 65534:65534 " + all.string()).c_str());
            (void)(::setgroups(0, nullptr) == 0 && ::setgid(kSomebody) == 0 && ::setuid(kSomebody) == 0);
        }
        const rlimit none{.rlim_cur = 1, .rlim_max = 1};
        if (kMemoryIsThatOfTheService) { // a sanitizer needs a thread of its own to begin with
            ::setrlimit(RLIMIT_NPROC, &none);
        }
    };
    ServiceProcess& service = start({}, {.beforeExec = becomeSomebody});
    service.limit(RLIMIT_NPROC, 1);
    const std::string process = "/proc/" + std::to_string(service.pid());
    const bool isHeldToIt =
        kMemoryIsThatOfTheService && contentOf(process + "/status").find("\nUid:\t0\t") == std::string::npos;
    for (int i = 0; i < 50; ++i) {
        Session client(service.socketPath(), 7, 11);
        EXPECT_THAT(client.call(message({{"n", i}})), IsDone());
        EXPECT_TRUE(i % 2 == 0 || client.stop());
        EXPECT_TRUE(bystanderIsServed());
        EXPECT_TRUE(!isHeldToIt || entriesOf(process + "/task") == 1);
    }
    if (!isHeldToIt) {
        GTEST_SKIP() << "a sanitizer, or root, is not held to the limit on threads";
    }
}

TEST_F(Hostile, FilesKeepTheirBoundWhateverTheLine) {
    constexpr std::uintmax_t kBound = 64U << 20U;
    ServiceProcess& service = start();
    Session client(service.socketPath());
    ASSERT_THAT(client.call(message({{"n", 0}})), IsDone());
    const std::array sinks{service.logs() / "analytics-events.jsonl", service.logs() / "call-quality.jsonl"};
    for (const auto& sink : sinks) {
        // Before its first line is written, the service may take what it finds there for a torn one.
        ASSERT_TRUE(eventually([&] { return !contentOf(sink).empty(); }));
        std::filesystem::resize_file(sink, kBound - 500'000);
    }
    ::usleep(150'000); // after which the files' sizes are looked up again
    for (int i = 0; i < 2; ++i) {
        ASSERT_THAT(client.call(message({{"n", i}, {"text", std::string(900'000, 'x')}})), IsDone());
    }
    EXPECT_TRUE(client.stop());
    for (const auto& sink : sinks) {
        EXPECT_TRUE(eventually([&] { return std::filesystem::exists(sink.string() + ".1"); })) << sink;
        EXPECT_LE(std::filesystem::file_size(sink), kBound);
        EXPECT_LE(std::filesystem::file_size(sink.string() + ".1"), kBound);
    }
}

TEST_F(Hostile, OnlyRootAndTheServicesOwnUserMayEndIt) {
    ServiceProcess& service = start();
    if (::geteuid() != 0) {
        GTEST_SKIP() << "nobody else can be had";
    }
    // The kernel tells of the user who connects.
    ::chmod(service.socketPath().c_str(), 0666);
    ::chmod(service.runtimeDirectory().c_str(), 0711);
    ::chmod(std::filesystem::path(service.runtimeDirectory()).parent_path().c_str(), 0711);
    ASSERT_EQ(::seteuid(65'534), 0);
    RawClient other(service.socketPath());
    ASSERT_EQ(::seteuid(0), 0);
    const auto reply = other.call(Method::killService);
    EXPECT_TRUE(reply && reply->error && reply->error->code == -32000);
    EXPECT_THAT(other.call(Method::getAllReporters), IsDone());
}

} // namespace
} // namespace tamblo::test
