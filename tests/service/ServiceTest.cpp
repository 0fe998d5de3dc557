#include "tests/service/RawClient.h"
#include "tests/service/ServiceProcess.h"

#include <gtest/gtest.h>

#include <csignal>
#include <string>

#include <fcntl.h>
#include <sys/socket.h>

// What one client sees of a running service, and what lies on the disk afterwards.

namespace tamblo::test {
namespace {

using wire::Method;

TEST(Service, MessageOfAStartedSessionBecomesTwoEvents) {
    ServiceProcess service;
    RawClient client(service.socketPath());
    EXPECT_EQ(client.call(request(Method::createReportingSession, 7))->result, Value(true));
    wire::Request type = request(Method::setServiceType, 7);
    type.serviceType = 7;
    EXPECT_EQ(client.call(type)->result, Value(true));
    wire::Request configuration = request(Method::setConfiguration, 7);
    configuration.dictionary = {{"HostApplicationDisplayID", "com.example.music"}};
    EXPECT_EQ(client.call(configuration)->result, Value(true));
    EXPECT_EQ(client.call(request(Method::getServiceNameForReporterID, 7))->result, Value(7));
    EXPECT_EQ(client.call(request(Method::getAllReporters))->result, Value(Array{7}));

    wire::Request start = request(Method::startReportingSessionForID, 7);
    start.id = 77;
    client.send(start);
    EXPECT_TRUE(client.staysSilent());
    const Dictionary payload{{"route name", "Speaker"}, {"level", 0.25F}, {"zrreporting_timestamp", 4e9}};
    const auto answered = client.call(message(payload, {7}, 0x08000004, 1));
    ASSERT_TRUE(answered);
    EXPECT_FALSE(answered->error);
    EXPECT_FALSE(answered->result);

    const std::string expected =
        R"("payload":{"HostApplicationDisplayID":"com.example.music","audiotag":"Session_PlaybackStart",)"
        R"("level":0.25,"route_name":"Speaker","zrreporting_timestamp":4000000000.0}})";
    for (const std::string subject : {"tamblo", "longformaudio"}) {
        const std::string name = R"(,"event":"com.vandra.)" + subject + R"(.Session_Playback.Start",)";
        EXPECT_EQ(service.countEvents(name + expected), 1U) << subject;
    }
    EXPECT_EQ(service.countEvents("Playback.Start"), 2U);

    // The stop answers the held start first.
    wire::Request stop = request(Method::stopReportingSessionForID, 7);
    const auto held = client.call(stop);
    EXPECT_EQ(held->id, 77U);
    EXPECT_EQ(held->result, Value(true));
    EXPECT_EQ(client.receive()->result, Value(true));
    EXPECT_EQ(client.call(request(Method::destroyReportingSession, 7))->result, Value(true));
    EXPECT_EQ(client.call(request(Method::getServiceNameForReporterID, 7))->result, Value(65535));
}

TEST(Service, WhatIsAnsweredSurvivesAKill) {
    ServiceProcess service;
    RawClient client(service.socketPath());
    startSession(client, 7);
    for (int i = 0; i < 100; ++i) {
        ASSERT_TRUE(client.call(message({{"n", i}}, {7})));
    }
    service.signal(SIGKILL);
    EXPECT_EQ(service.awaitEnd(), -SIGKILL);
    EXPECT_EQ(service.countEvents("Playback.Start"), 200U);
}

TEST(Service, EndsAsAskedTo) {
    ServiceProcess service;
    {
        RawClient client(service.socketPath());
        startSession(client, 7);
        client.send(message({{"last", true}}, {7}));
        EXPECT_EQ(service.stop(), 0);
        EXPECT_TRUE(client.isClosedByService());
    }
    EXPECT_FALSE(std::filesystem::exists(service.socketPath()));
    EXPECT_EQ(service.countEvents("\"last\":true"), 2U);
    EXPECT_EQ(service.countEvents("zrreportingclientuptime"), 1U);

    service.start();
    RawClient killer(service.socketPath());
    killer.send(request(Method::killService));
    EXPECT_EQ(service.awaitEnd(), 2);
    EXPECT_NE(service.errorOutput().find("DESTROYING SERVICE"), std::string::npos);
    // The socket that the killed service left behind is replaced.
    service.start();
    EXPECT_TRUE(RawClient(service.socketPath()).call(request(Method::getAllReporters)));

    // A second signal ends it at once, without a word about its clients.
    service.signal(SIGSTOP);
    service.signal(SIGTERM);
    service.signal(SIGINT);
    service.signal(SIGCONT);
    EXPECT_EQ(service.awaitEnd(), 0);
    EXPECT_EQ(service.countEvents("zrreportingclientuptime"), 1U);
}

TEST(Service, WhatIsAnsweredAtItsEndIsInTheFile) {
    ServiceProcess service;
    RawClient before(service.socketPath()), after(service.socketPath());
    startSession(before, 7);
    startSession(after, 8);
    wire::Request last = message({{"last", true}}, {7});
    ASSERT_TRUE(before.call(last));
    last.id = 5;
    last.dictionary.set("n", 2);
    // Two more messages and the signal between them wait for the same wake-up.
    service.signal(SIGSTOP);
    before.send(last);
    service.signal(SIGTERM);
    last.reporterIDs = {8};
    after.send(last);
    service.signal(SIGCONT);
    EXPECT_EQ(service.awaitEnd(), 0);
    std::size_t answered = 1;
    for (RawClient* client : {&before, &after}) {
        for (auto reply = client->receive(); reply; reply = client->receive()) {
            answered += reply->id == 5 ? 1U : 0U;
        }
    }
    EXPECT_EQ(service.countEvents("\"last\":true"), 2 * answered);
}

TEST(Service, ClientThatLeavesIsReportedOnce) {
    ServiceProcess service;
    {
        RawClient client(service.socketPath());
        startSession(client, 7);
        client.send(message({{"n", 1}}, {7}));
        // What was sent before the end, within a frame, is answered to who still listens.
        wire::Request reporters = request(Method::getAllReporters);
        reporters.id = 5;
        client.send(reporters);
        client.sendBytes(std::string("\x40\x00\x00\x00\x84\x00\x05", 7));
        ::shutdown(client.descriptor(), SHUT_WR);
        EXPECT_EQ(client.receive()->result, Value(Array{7}));
        EXPECT_FALSE(client.receive());
    }
    EXPECT_TRUE(eventually([&] { return service.countEvents("zrreportingclientuptime") == 1; }));
    RawClient other(service.socketPath());
    EXPECT_EQ(other.call(request(Method::getAllReporters))->result, Value(Array{}));
    EXPECT_EQ(service.countEvents("\"n\":1"), 2U);
    EXPECT_EQ(service.countEvents("zrreportingclientuptime"), 1U);
}

TEST(Service, WhatKeepsItFromStartingIsOneClearLine) {
    ServiceProcess first;
    const std::string longPath = (std::filesystem::temp_directory_path() / std::string(90, 'x')).string();
    const std::string taken = (std::filesystem::temp_directory_path() / "tamblo-taken").string();
    writeFile(taken + "/com.vandra.tamblo.reporting", "somebody's");
    const auto activateWithoutSocket = [] {
        ::setenv("LISTEN_PID", std::to_string(::getpid()).c_str(), 1);
        ::setenv("LISTEN_FDS", "1", 1);
    };
    const struct {
        std::string runtimeDirectory;
        std::string mentions;
        std::function<void()> beforeExec;
    } cases[] = {
        {"/proc/tamblo", "/proc/tamblo", {}},
        {longPath, "too long", {}},
        {taken, "no socket: remove it", {}},
        {taken, "file descriptor 3", activateWithoutSocket},
        {first.directory() / "run", "already answers at " + first.socketPath(), {}},
    };
    for (const auto& hindrance : cases) {
        ServiceProcess service({.environment = {{"RUNTIME_DIRECTORY", hindrance.runtimeDirectory}},
                                .beforeExec = hindrance.beforeExec,
                                .awaitsReady = false});
        EXPECT_EQ(service.awaitEnd(), 1) << hindrance.mentions;
        const std::string said = service.errorOutput();
        EXPECT_NE(said.find(hindrance.mentions), std::string::npos) << said;
        EXPECT_EQ(std::count(said.begin(), said.end(), '\n'), 1) << said;
    }
    EXPECT_TRUE(RawClient(first.socketPath()).call(request(Method::getAllReporters)));
    EXPECT_EQ(readFile(taken + "/com.vandra.tamblo.reporting"), "somebody's");
    std::filesystem::remove_all(taken);
    std::filesystem::remove_all(longPath);
}

TEST(Service, TakesOverAnActivatedSocketAndTellsItsManager) {
    std::string directory = (std::filesystem::temp_directory_path() / "tamblo-act-XXXXXX").string();
    ASSERT_NE(::mkdtemp(directory.data()), nullptr);
    const std::string path = directory + "/activated";
    const int listening = boundSocket(SOCK_STREAM, path);
    ASSERT_EQ(::listen(listening, 8), 0);
    const int manager = boundSocket(SOCK_DGRAM, directory + "/notify");
    // A client may connect before the service runs.
    RawClient early(path);

    ServiceProcess service({.environment = {{"NOTIFY_SOCKET", directory + "/notify"}},
                            .beforeExec =
                                [listening] {
                                    ::dup2(listening, 3);
                                    ::fcntl(3, F_SETFD, 0);
                                    ::setenv("LISTEN_PID", std::to_string(::getpid()).c_str(), 1);
                                    ::setenv("LISTEN_FDS", "1", 1);
                                },
                            .awaitsReady = false});
    EXPECT_TRUE(early.call(request(Method::getAllReporters)));
    EXPECT_FALSE(std::filesystem::exists(service.socketPath()));
    std::array<char, 64> told{};
    EXPECT_GT(::recv(manager, told.data(), told.size(), 0), 0);
    EXPECT_STREQ(told.data(), "READY=1");
    EXPECT_EQ(service.stop(), 0);
    told.fill(0);
    EXPECT_GT(::recv(manager, told.data(), told.size(), 0), 0);
    EXPECT_STREQ(told.data(), "STOPPING=1");
    EXPECT_TRUE(std::filesystem::exists(path));
    ::close(listening);
    ::close(manager);
    std::filesystem::remove_all(directory);
}

TEST(Service, PreferenceIsInForceForTheNextMessage) {
    ServiceProcess service;
    const auto preferences = service.preferenceFile("com.vandra.tamblo.analytics");
    RawClient client(service.socketPath());
    startSession(client, 7);
    writeFile(preferences, R"({"events_in_use": ["com.vandra.telephony.*"]})");
    client.call(message({{"n", 1}}, {7}));
    EXPECT_EQ(service.countEvents("Playback.Start"), 1U);
    std::filesystem::remove(preferences);
    client.call(message({{"n", 2}}, {7}));
    EXPECT_EQ(service.countEvents("Playback.Start"), 3U);
}

TEST(Service, SleepsWhenThereIsNothingToDo) {
    ServiceProcess service;
    {
        RawClient client(service.socketPath());
        startSession(client, 7);
        client.call(message({{"n", 1}}, {7}));
        client.call(request(Method::stopReportingSessionForID, 7));
    }
    const std::filesystem::path process = "/proc/" + std::to_string(service.pid());
    const auto wakeUps = [&process] {
        const std::string status = readFile(process / "status");
        return std::stoul(status.substr(status.find("\nvoluntary_ctxt_switches:") + 26));
    };
    // The pool's threads end after some idle seconds; then nothing moves any more.
    EXPECT_TRUE(eventually([&process] {
        using Tasks = std::filesystem::directory_iterator;
        return std::distance(Tasks(process / "task"), Tasks()) == 1;
    }));
    const std::size_t before = wakeUps();
    ::usleep(1'000'000);
    EXPECT_EQ(wakeUps(), before);
}

} // namespace
} // namespace tamblo::test
