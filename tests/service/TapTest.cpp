#include "tests/service/RealService.h"

#include <gmock/gmock.h>
#include <nlohmann/json.hpp>

#include <atomic>
#include <map>
#include <sstream>
#include <string>
#include <thread>
#include <vector>

// Messages that are shown while a real service records them, and what a reader who does not read costs
// others.

namespace tamblo::test {
namespace {

using nlohmann::json;
using testing::ElementsAre;
using testing::HasSubstr;
using Clock = std::chrono::steady_clock;
using Seconds = std::chrono::duration<double>;

/// A tap that is open, or refused, by now: requests are taken in the order in which they come.
StatusReader tapOf(const ServiceProcess& service, const std::string& filter) {
    StatusReader reader(service);
    reader.send("tap " + filter + "\n");
    (void)statusText(service, "status");
    return reader;
}

/// What a tap shows up to its end.
std::vector<json> shownBy(const StatusReader& tap) {
    std::vector<json> lines;
    std::istringstream text(tap.rest());
    for (std::string line; std::getline(text, line);) {
        lines.push_back(json::parse(line));
    }
    return lines;
}

std::vector<int> numbersOf(const StatusReader& tap) {
    std::vector<int> numbers;
    for (const json& line : shownBy(tap)) {
        numbers.push_back(line["payload"].value("n", 0));
    }
    return numbers;
}

TEST(Tap, FiltersSampleAndLimitSayWhatIsShown) {
    ServiceProcess service;
    const StatusReader all = tapOf(service, "");
    const StatusReader ofReporter = tapOf(service, R"({"reporter":7,"has":"n"})");
    const StatusReader ofKind = tapOf(service, R"({"category":[4,2],"type":1,"has":["n"]})");
    const StatusReader ofEvent = tapOf(service, R"({"event":["com.vandra.tamblo.Playback.Sto*","none"]})");
    const StatusReader ofService = tapOf(service, R"({"event":"com.vandra.telephony.Playback.Start"})");
    const StatusReader ofKeys = tapOf(service, R"({"keys":{"route":["headphones","usb"],"n":[4,5]}})");
    const StatusReader sample = tapOf(service, R"({"has":["n","route"],"sample":2})");
    const StatusReader limit = tapOf(service, R"({"has":"n","limit":2})");
    // The ninth, and filters that are none.
    for (const std::string refused :
         {"{}", "[]", R"({"colour":1})", R"({"limit":0})", R"({"type":65536})", R"({"recording":true})",
          R"({"recording":true,"reporter":7,"event":"*"})"}) {
        const auto lines = shownBy(tapOf(service, refused));
        ASSERT_EQ(lines.size(), 1);
        EXPECT_THAT(lines[0].value("error", ""), HasSubstr(refused == "{}" ? "8 taps" : "filter")) << refused;
    }
    Session client(service.socketPath(), 7);
    client.start(8, 7);
    const Dictionary headphones{{"n", 4}, {"route", "headphones"}};
    client.call(message({{"n", 1}, {"route", "speaker"}}, {7}));
    client.call(message({{"n", 2}, {"route", "usb"}}, {7}, 4, 2));
    client.call(message({{"n", 3}}, {8}, 2, 1));
    client.call(message(headphones, {8}));
    client.call(message(headphones, {8}));
    client.call(message({{"n", 5}, {"route", "usb"}}, {7}));
    EXPECT_THAT(numbersOf(limit), ElementsAre(1, 2));
    // An ended tap has made room.
    const StatusReader another = tapOf(service, R"({"has":"n"})");
    client.call(message({{"n", 6}}, {8}));
    service.stop();
    EXPECT_THAT(numbersOf(ofReporter), ElementsAre(1, 2, 5));
    EXPECT_THAT(numbersOf(ofKind), ElementsAre(1, 3, 4, 5, 6));
    EXPECT_THAT(numbersOf(ofEvent), ElementsAre(2));
    EXPECT_THAT(numbersOf(ofService), ElementsAre(1, 5));
    EXPECT_THAT(numbersOf(ofKeys), ElementsAre(4, 5));
    EXPECT_THAT(numbersOf(sample), ElementsAre(1, 4));
    EXPECT_THAT(numbersOf(another), ElementsAre(6));

    std::map<std::string, int> origins;
    for (json line : shownBy(all)) {
        ++origins[line["origin"]];
        if (line["payload"].value("n", 0) == 4) {
            EXPECT_GT(line["time"], 1.7e9);
            EXPECT_EQ(line["payload"]["audiotag"], "PlaybackStart");
            line.erase("time");
            line.erase("payload");
            EXPECT_EQ(line,
                      json::parse(R"({"reporter":8,"service":"longformaudio","started":true,"category":4,
                "type":1,"origin":"message","event":"com.vandra.tamblo.Playback.Start"})"));
        }
    }
    EXPECT_EQ(origins["message"], 6);
    EXPECT_EQ(origins["session"], 4); // the starts and stops
    EXPECT_GT(origins["derived"], 0);
}

TEST(Tap, ALargePayloadIsNotShown) {
    ServiceProcess service;
    const StatusReader tap = tapOf(service, R"({"has":["text"],"limit":2})");
    Session client(service.socketPath());
    client.call(message({{"text", std::string(100'000, 'x')}}));
    client.call(message({{"text", std::string(40'000, 'y')}}));
    const auto lines = shownBy(tap);
    ASSERT_EQ(lines.size(), 2);
    EXPECT_GE(lines[0].value("payload_left_out", 0), 100'000);
    EXPECT_FALSE(lines[0].contains("payload"));
    EXPECT_EQ(lines[1]["payload"]["text"], std::string(40'000, 'y'));
}

TEST(Tap, ARecordingMissesNothingThoughItsReaderIsSlow) {
    ServiceProcess service;
    const std::string filter = R"({"reporter":7,"limit":121,"recording":true})";
    const StatusReader recording = tapOf(service, filter);
    EXPECT_THAT(shownBy(tapOf(service, filter)).at(0).value("error", ""), HasSubstr("a recording"));
    Session client(service.socketPath(), 7);
    const std::string text(20'000, 'x');
    for (int i = 0; i < 120; ++i) {
        client.call(message({{"n", i}, {"text", text}}, {7}));
    }
    const std::string large(200'000, 'y');
    client.call(message({{"n", 120}, {"text", large}}, {7}));
    const auto lines = shownBy(recording);
    ASSERT_EQ(lines.size(), 121U);
    for (std::size_t i = 0; i < lines.size(); ++i) {
        ASSERT_EQ(lines[i]["payload"].value("n", -1), static_cast<int>(i));
    }
    EXPECT_EQ(lines.back()["payload"]["text"], large);
}

TEST(Tap, WhatThereIsNoTimeToLookAtIsLeftOut) {
    ServiceProcess service;
    // None of the patterns matches, but it takes long to see that.
    json filter;
    for (int i = 0; i != 200; ++i) {
        filter["event"].push_back("com.vandra.tamblo.Playback.Star_*");
    }
    std::vector<StatusReader> taps;
    for (int i = 0; i != 8; ++i) {
        taps.push_back(tapOf(service, filter.dump()));
    }
    Session client(service.socketPath(), 7);
    std::string frames;
    for (int i = 0; i != 20'000; ++i) {
        frames += framesOf(message({{"n", i}}, {7}));
    }
    ASSERT_TRUE(client.send(frames));
    for (int i = 0; i != 20'000; ++i) {
        ASSERT_TRUE(client.receive());
    }
    service.stop();
    for (const StatusReader& tap : taps) {
        const auto lines = shownBy(tap);
        EXPECT_FALSE(lines.empty());
        for (const json& line : lines) {
            EXPECT_GT(line.value("left_out", 0), 0) << line;
        }
    }
}

/// `tambloctl tap`, whose output goes to a file.
class TapProcess {
public:
    TapProcess(const ServiceProcess& service, const char* key)
        : directory_(service.runtimeDirectory()), pid_(::fork()) {
        if (pid_ == 0) {
            ::prctl(PR_SET_PDEATHSIG, SIGKILL);
            ::dup2(::open(path().c_str(), O_WRONLY | O_CREAT, 0600), STDOUT_FILENO);
            ::setenv("RUNTIME_DIRECTORY", directory_.c_str(), 1);
            ::execl(TAMBLOCTL_PATH, "tambloctl", "tap", "--json", "--key", key, nullptr);
            ::_exit(127);
        }
    }
    ~TapProcess() {
        signal(SIGKILL);
        ::waitpid(pid_, nullptr, 0);
    }
    TapProcess(const TapProcess&) = delete;
    TapProcess& operator=(const TapProcess&) = delete;
    void signal(int number) const { ::kill(pid_, number); }
    [[nodiscard]] std::vector<std::string> lines() const { return linesOf(path()); }

private:
    [[nodiscard]] std::string path() const { return directory_ + "/tap"; }

    const std::string directory_;
    const pid_t pid_;
};

/// One that sends numbered messages of some size, and awaits no reply until it has sent them all.
class Flood {
public:
    explicit Flood(const ServiceProcess& service) : client_(service.socketPath()) {}
    void send(int count) {
        const int end = next_ + count;
        std::thread replies([this, count] {
            for (int i = 0; i != count && client_.receive(); ++i) {
            }
        });
        for (; next_ != end; ++next_) {
            client_.send(framesOf(message({{"flood", next_}, {"text", std::string(30'000, 'f')}})));
        }
        replies.join();
    }
    [[nodiscard]] int sent() const noexcept { return next_; }

private:
    Session client_;
    int next_ = 0;
};

/// The median of another client's calls while there is a flood.
Seconds paceUnder(Flood& flood, RawClient& other) {
    std::atomic<bool> isOver = false;
    std::thread flooding([&] {
        flood.send(400);
        isOver = true;
    });
    std::vector<Seconds> times;
    do {
        const auto start = Clock::now();
        (void)other.call(Method::getAllReporters);
        times.emplace_back(Clock::now() - start);
    } while (!isOver);
    flooding.join();
    std::ranges::nth_element(times, times.begin() + static_cast<std::ptrdiff_t>(times.size() / 2));
    return times[times.size() / 2];
}

TEST(Tap, WhoDoesNotReadHoldsUpNobodyAndIsToldHowMuchWasLeftOut) {
    const ServiceProcess service;
    Flood flood(service);
    RawClient other(service.socketPath());
    const Seconds usual = paceUnder(flood, other);
    const TapProcess tap(service, "flood");
    ASSERT_TRUE(eventually([&] {
        flood.send(1);
        return !tap.lines().empty();
    }));
    tap.signal(SIGSTOP);
    const Seconds beside = paceUnder(flood, other);
    EXPECT_LT(beside, 5 * usual + std::chrono::milliseconds(50));
    tap.signal(SIGCONT);

    // Each line is the next message, or says how many were left out in its place.
    int told = 0;
    const auto isComplete = [&] {
        told = 0;
        int next = -1;
        for (const std::string& text : tap.lines()) {
            const json line = json::parse(text, nullptr, false);
            if (line.is_discarded()) {
                return false; // still being written
            }
            if (line.contains("left_out")) {
                told += line.value("left_out", 0);
                next += line.value("left_out", 0);
                continue;
            }
            const int number = line["payload"].value("flood", -1);
            EXPECT_TRUE(next < 0 || number == next) << number;
            next = number + 1;
        }
        return next == flood.sent();
    };
    EXPECT_TRUE(eventually(isComplete));
    EXPECT_GT(told, 0);
    flood.send(1);
    EXPECT_TRUE(eventually(isComplete));
}

} // namespace
} // namespace tamblo::test
