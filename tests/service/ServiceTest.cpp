#include "os/FileDescriptor.h"
#include "tests/service/RealService.h"

#include <gmock/gmock.h>

#include <sys/file.h>
#include <sys/stat.h>

// How the service begins and ends, what one client sees of it, and what lies on the disk afterwards.

namespace tamblo::test {
namespace {

using testing::HasSubstr;

/// Says to this process that it was handed one.
void announceSocket() {
    ::setenv("LISTEN_PID", std::to_string(::getpid()).c_str(), 1);
    ::setenv("LISTEN_FDS", "1", 1);
}

TEST(Service, MessageOfAStartedSessionBecomesTwoEvents) {
    ServiceProcess service;
    RawClient client(service.socketPath());
    for (const wire::Request& next : {request(Method::createReportingSession, 7),
                                      {.method = Method::setServiceType, .reporterID = 7, .serviceType = 7},
                                      {.method = Method::setConfiguration,
                                      .reporterID = 7,
                                      .dictionary = {{"HostApplicationDisplayID", "com.example.music"}}}}) {
        EXPECT_EQ(client.call(next)->result, Value(true));
    }
    EXPECT_EQ(client.call(Method::getServiceNameForReporterID, 7)->result, Value(7));
    EXPECT_EQ(client.call(Method::getAllReporters)->result, Value(Array{7}));

    client.send(framesOf(request(Method::startReportingSessionForID, 7), 77));
    const Dictionary payload{{"route name", "Speaker"}, {"level", 0.25F}, {"zrreporting_timestamp", 4e9}};
    const auto answered = client.call(message(payload, {7}, 0x08000004));
    EXPECT_TRUE(answered && !answered->error && !answered->result);
    EXPECT_EQ(service.countEvents(R"(,"event":"com.vandra.longformaudio.Session_Playback.Start","payload":{)"
                                  R"("HostApplicationDisplayID":"com.example.music",)"
                                  R"("audiotag":"Session_PlaybackStart","level":0.25,"route_name":"Speaker",)"
                                  R"("zrreporting_timestamp":4000000000.0}})"),
              1U);
    // The stop answers the held start first.
    const auto held = client.call(Method::stopReportingSessionForID, 7);
    EXPECT_EQ(held->id, 77U);
    EXPECT_EQ(held->result, Value(true));
    EXPECT_EQ(client.receive()->result, Value(true));
    EXPECT_EQ(client.call(Method::destroyReportingSession, 7)->result, Value(true));
    EXPECT_EQ(client.call(Method::getServiceNameForReporterID, 7)->result, Value(65535));
}

TEST(Service, WhatIsAnsweredSurvivesAKill) {
    ServiceProcess service({.environment = {{"TAMBLO_LOG", "error"}}});
    std::string frames;
    for (int i = 0; i < 400; ++i) {
        frames += framesOf(message({{"n", i}}));
    }
    // One is answered, then ever more of those that follow at once, before the kill.
    for (const std::size_t awaited : {0, 1, 2, 3, 10, 30, 64, 100, 200, 400}) {
        const std::size_t before = service.countEvents("Playback.Start");
        Session client(service.socketPath());
        EXPECT_TRUE(client.call(message({{"n", 1}})));
        client.send(frames);
        for (std::size_t i = 0; i < awaited; ++i) {
            ASSERT_TRUE(client.receive());
        }
        service.signal(SIGKILL);
        EXPECT_EQ(service.awaitEnd(), -SIGKILL);
        const std::size_t answered = 1 + awaited + client.receiveAll();
        EXPECT_GE(service.countEvents("Playback.Start") - before, 2 * answered);
        service.start();
    }
}

TEST(Service, EndsAsAskedTo) {
    ServiceProcess service;
    {
        Session client(service.socketPath());
        client.send(framesOf(message({{"last", true}})));
        EXPECT_EQ(service.stop(), 0);
        EXPECT_TRUE(client.isClosedByService());
    }
    EXPECT_FALSE(std::filesystem::exists(service.socketPath()));
    EXPECT_EQ(service.countEvents("\"last\":true"), 2U);
    EXPECT_EQ(service.countEvents("zrreportingclientuptime"), 1U);
    // A second signal ends it at once, without a word about its clients.
    service.start();
    const Session client(service.socketPath());
    for (const int signal : {SIGSTOP, SIGTERM, SIGINT, SIGCONT}) {
        service.signal(signal);
    }
    EXPECT_EQ(service.awaitEnd(), 0);
    EXPECT_EQ(service.countEvents("zrreportingclientuptime"), 1U);
}

TEST(Service, ClientThatLeavesIsReportedOnce) {
    ServiceProcess service;
    {
        Session client(service.socketPath());
        // What was sent before the end, within a frame, is answered to who still listens.
        EXPECT_TRUE(client.call(message({{"n", 1}})));
        client.send(framesOf(request(Method::getAllReporters)) + std::string("\x40\0\0\0\x84\0\x05", 7));
        ::shutdown(client.descriptor(), SHUT_WR);
        EXPECT_EQ(client.receive()->result, Value(Array{7}));
        EXPECT_FALSE(client.receive());
    }
    EXPECT_TRUE(eventually([&] { return service.countEvents("zrreportingclientuptime") == 1; }));
    RawClient other(service.socketPath());
    EXPECT_EQ(other.call(Method::getAllReporters)->result, Value(Array{}));
    EXPECT_EQ(service.countEvents("\"n\":1"), 2U);
    EXPECT_EQ(countOf("interruptionHandler", service.errorOutput()), 0U);
}

TEST(Service, WhatKeepsItFromStartingIsOneClearLine) {
    ServiceProcess first;
    const TemporaryDirectory directory;
    const std::string taken = directory.path("taken/com.vandra.tamblo.reporting");
    writeFile(taken, "somebody's");
    const struct {
        std::string runtimeDirectory;
        std::string mentions;
        std::function<void()> beforeExec{};
    } cases[] = {
        {"/proc/tamblo", "/proc/tamblo"},
        {directory.path(std::string(90, 'x')), "too long"},
        {directory.path("taken"), "no socket: remove it"},
        {directory.path("taken"), "file descriptor 3", announceSocket},
        {first.runtimeDirectory(), "already answers at " + first.socketPath()},
        {directory.path("locked"), directory.path("locked") + " locked: end it"},
    };
    std::filesystem::create_directory(directory.path("locked"));
    const FileDescriptor lock(::open(directory.path("locked").c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC));
    ASSERT_EQ(::flock(lock.get(), LOCK_EX), 0);
    for (const auto& hindrance : cases) {
        ServiceProcess service({.environment = {{"RUNTIME_DIRECTORY", hindrance.runtimeDirectory}},
                                .beforeExec = hindrance.beforeExec,
                                .awaitsReady = false});
        EXPECT_EQ(service.awaitEnd(), 1) << hindrance.mentions;
        EXPECT_THAT(service.errorOutput(), HasSubstr(hindrance.mentions));
        EXPECT_EQ(countOf("\n", service.errorOutput()), 1U) << service.errorOutput();
    }
    EXPECT_TRUE(RawClient(first.socketPath()).call(Method::getAllReporters));
    EXPECT_EQ(contentOf(taken), "somebody's");
}

TEST(Service, TakesNoArgumentsButThoseThatAskAboutIt) {
    const std::string refusal = "tamblod: no arguments are taken but --help and --version\n";
    for (const char* words : {"-h", "''", "serve", "--help --version", "--version 2"}) {
        const CommandResult result = run(std::string(TAMBLOD_PATH) + " " + words);
        EXPECT_EQ(result.output, refusal) << words;
        EXPECT_EQ(result.status, 2) << words;
    }
    EXPECT_THAT(run(TAMBLOD_PATH " --version").output,
                testing::MatchesRegex("tamblod [0-9]+\\.[0-9]+\\.[0-9]+\n"));
    const CommandResult help = run(TAMBLOD_PATH " --help 2>/dev/null");
    EXPECT_TRUE(help.output.starts_with("usage: tamblod ")) << help.output;
    EXPECT_EQ(help.status, 0);
}

TEST(Service, TakesOverAnActivatedSocketAndTellsItsManager) {
    const TemporaryDirectory directory;
    const std::string path = directory.path("activated");
    const int listening = boundSocket(SOCK_STREAM, path);
    const int manager = boundSocket(SOCK_DGRAM, directory.path("notify"));
    const auto told = [manager] {
        std::array<char, 64> text;
        do {
            text = {};
            EXPECT_GT(::recv(manager, text.data(), text.size() - 1, 0), 0);
        } while (std::string_view(text.data()).starts_with("STATUS="));
        return std::string(text.data());
    };
    // A client may connect before the service runs.
    RawClient early(path);
    const auto passSocket = [listening] {
        ::dup2(listening, 3);
        ::fcntl(3, F_SETFD, 0);
        announceSocket();
    };
    ServiceProcess service({.environment = {{"NOTIFY_SOCKET", directory.path("notify")}},
                            .beforeExec = passSocket,
                            .awaitsReady = false});
    EXPECT_TRUE(early.call(Method::getAllReporters));
    EXPECT_FALSE(std::filesystem::exists(service.socketPath()));
    EXPECT_EQ(told(), "READY=1");
    EXPECT_EQ(service.stop(), 0);
    EXPECT_EQ(told(), "STOPPING=1");
    EXPECT_TRUE(std::filesystem::exists(path));
    ::close(listening);
    ::close(manager);
}

TEST(Service, SocketIsForAllWhoMayEnterItsDirectoryAndNotItsSuccessors) {
    ServiceProcess service({.beforeExec = [] { ::umask(077); }});
    const auto modeOf = [](const std::string& path) {
        return static_cast<int>(std::filesystem::status(path).permissions());
    };
    EXPECT_EQ(modeOf(service.socketPath()), 0666);
    EXPECT_EQ(modeOf(service.runtimeDirectory()), 0700);

    std::filesystem::remove(service.socketPath());
    const ServiceProcess successor({.environment = {{"RUNTIME_DIRECTORY", service.runtimeDirectory()}}});
    EXPECT_EQ(service.stop(), 0);
    EXPECT_TRUE(RawClient(service.socketPath()).call(Method::getAllReporters));
}

TEST(Service, OfTwoThatStartAtOnceOneServes) {
    ServiceProcess before;
    before.signal(SIGKILL);
    EXPECT_EQ(before.awaitEnd(), -SIGKILL);
    // Whoever takes the left-over socket for theirs to replace takes turns.
    const int directory = ::open(before.runtimeDirectory().c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC);
    ASSERT_EQ(::flock(directory, LOCK_EX), 0);
    const ServiceProcess::Options options{.environment = {{"RUNTIME_DIRECTORY", before.runtimeDirectory()}},
                                          .awaitsReady = false};
    ServiceProcess one(options), other(options);
    const auto waits = [&](const ServiceProcess& service) {
        const std::string descriptors = "ls -l /proc/" + std::to_string(service.pid()) + "/fd";
        return countOf("-> " + before.runtimeDirectory() + "\n", run(descriptors).output) != 0;
    };
    EXPECT_TRUE(eventually([&] { return waits(one) && waits(other); }));
    ::close(directory);
    EXPECT_TRUE(eventually([&] {
        return countOf("another tamblod already answers", one.errorOutput() + other.errorOutput()) == 1;
    }));
    EXPECT_TRUE(RawClient(before.socketPath()).call(Method::getAllReporters));
    EXPECT_EQ(one.stop().value() + other.stop().value(), 1);
}

TEST(Service, SleepsWhenThereIsNothingToDo) {
    ServiceProcess service;
    {
        Session client(service.socketPath());
        client.call(message({{"n", 1}}));
        EXPECT_TRUE(client.stop());
    }
    const std::filesystem::path process = "/proc/" + std::to_string(service.pid());
    const auto wakeUps = [&process] {
        const std::string status = contentOf(process / "status");
        return std::stoul(status.substr(status.find("\nvoluntary_ctxt_switches:") + 26));
    };
    // The pool's threads end after some idle seconds; then nothing moves any more.
    EXPECT_TRUE(eventually([&process] { return entriesOf(process / "task") == 1; }));
    const std::size_t before = wakeUps();
    ::usleep(500'000);
    EXPECT_EQ(wakeUps(), before);
}

} // namespace
} // namespace tamblo::test
