#include "platform/linux/loop/LinuxWorkQueues.h"
#include "platform/linux/settings/LinuxNamedNotifications.h"
#include "tests/fakes/FakeSerialQueue.h"
#include "tests/platform/LinuxServiceSupport.h"

#include <gmock/gmock.h>

#include <algorithm>
#include <atomic>
#include <cerrno>
#include <chrono>
#include <cstdint>
#include <filesystem>
#include <fstream>
#include <future>
#include <memory>
#include <thread>
#include <utility>
#include <vector>

#include <sys/stat.h>

namespace tamblo {
namespace {

using testing::ElementsAre;
using testing::HasSubstr;
using testing::IsEmpty;
using testing::UnorderedElementsAre;

class NamedNotificationsTest : public testing::Test {
protected:
    NamedNotificationsTest() {
        std::filesystem::create_directory(path_); // watched from before it is there
        deliver();
    }

    /// A registration, whose handler notes its call and then does what is given.
    int add(
        std::string_view name, const NamedNotifications::Handler& then = [](int) {}) {
        const auto noted = [this, then](int called) {
            calls_.push_back(called);
            then(called);
        };
        const auto [status, token] = notifications_.RegisterNamedNotification(name, queue_, noted);
        EXPECT_EQ(status, 0);
        EXPECT_GT(token, 0);
        return token;
    }
    void post(const std::string& name, const std::string& text) const {
        directory_.write("notifications/" + name, text);
    }
    void deliver() {
        EXPECT_TRUE(isReadable(notifications_.fileDescriptor(), 2000));
        while (isReadable(notifications_.fileDescriptor(), 0)) {
            notifications_.deliverPosts();
        }
    }
    /// The tokens of the handlers that a change, which must have come, had called.
    std::vector<int> callsAfterChange() {
        deliver();
        queue_.runAll();
        return std::exchange(calls_, {});
    }
    [[nodiscard]] std::pair<int, std::uint64_t> state(int token) {
        const auto [status, word] = notifications_.GetNamedNotificationState(token);
        return {status, word};
    }

    TemporaryDirectory directory_;
    const std::string path_ = directory_.path("notifications");
    RecordingLog log_;
    // Before the queue, which runs what waits when it goes.
    std::vector<int> calls_;
    LinuxNamedNotifications notifications_{path_, log_};
    FakeSerialQueue queue_{"test"};
};

TEST_F(NamedNotificationsTest, ReadsTheWordThatStandsInTheFile) {
    const int token = add("n");
    EXPECT_EQ(state(token), std::pair(ENOENT, 0UL));
    const struct {
        std::string text;
        int status;
        std::uint64_t word;
    } cases[] = {
        {"1", 0, 1},
        {" \t7\r\n", 0, 7},
        {"007\n", 0, 7},
        {"18446744073709551615\n", 0, UINT64_MAX},
        {"18446744073709551616", ERANGE, 0},
        {"99999999999999999999x", EBADMSG, 0},
        {"", EBADMSG, 0},
        {" \n", EBADMSG, 0},
        {"-1", EBADMSG, 0},
        {"+1", EBADMSG, 0},
        {"0x10", EBADMSG, 0},
        {"1 2", EBADMSG, 0},
        {"1.0", EBADMSG, 0},
        {std::string("1\0", 2), EBADMSG, 0},
        {std::string(256, ' ') + "1", EFBIG, 0},
        {std::string(255, ' ') + "1", 0, 1},
        {std::string(3UL << 20, '1'), EFBIG, 0},
    };
    for (const auto& [text, status, word] : cases) {
        post("n", text);
        EXPECT_EQ(state(token), std::pair(status, word)) << text.substr(0, 40);
        EXPECT_EQ(state(token).first, status);
        const bool isRubbish = status != 0 && text.find_first_not_of(" \n") != std::string::npos;
        EXPECT_EQ(log_.take().size(), isRubbish ? 1U : 0U) << text.substr(0, 40);
    }
    post("n", " 1 2");
    (void)state(token);
    EXPECT_THAT(log_.take(), ElementsAre("3 zrrs " + path_ +
                                         "/n: byte 2: not a 64-bit number in decimal; it is not used"));
    EXPECT_EQ(state(token + 1), std::pair(EBADF, 0UL));
    EXPECT_EQ(state(0), std::pair(EBADF, 0UL));

    std::filesystem::create_directory(path_ + "/directory");
    ASSERT_EQ(::mkfifo((path_ + "/pipe").c_str(), 0600), 0);
    post("target", "1");
    std::filesystem::create_symlink("target", path_ + "/link");
    for (const auto& [name, status] : {std::pair("directory", EISDIR), {"pipe", EINVAL}, {"link", ELOOP}}) {
        EXPECT_EQ(state(add(name)), std::pair(status, 0UL)) << name;
    }
}

TEST_F(NamedNotificationsTest, OnlyAPlainFileNameCanBeRegistered) {
    using namespace std::string_view_literals;
    const std::string longest(255, 'x'), tooLong(256, 'x');
    const std::pair<std::string_view, int> cases[] = {
        {"", EINVAL},   {".", EINVAL},      {"..", EINVAL},   {".n", EINVAL},          {"a/b", EINVAL},
        {"/n", EINVAL}, {"a\0b"sv, EINVAL}, {"../n", EINVAL}, {tooLong, ENAMETOOLONG},
    };
    for (const auto& [name, expected] : cases) {
        const auto [status, token] = notifications_.RegisterNamedNotification(name, queue_, [](int) {});
        EXPECT_EQ(status, expected) << name;
        EXPECT_EQ(token, 0) << name;
    }
    const int token = add(longest);
    post(longest, "1");
    EXPECT_THAT(callsAfterChange(), ElementsAre(token));
}

TEST_F(NamedNotificationsTest, EveryKindOfPostCallsEachRegistrationOfItsName) {
    const int first = add("n"), second = add("n"), other = add("other");
    EXPECT_NE(first, second);
    post("n", "1");
    EXPECT_THAT(callsAfterChange(), UnorderedElementsAre(first, second));
    post("n", "1"); // the same word again
    EXPECT_THAT(callsAfterChange(), UnorderedElementsAre(first, second));
    directory_.write("new", "2");
    std::filesystem::rename(directory_.path("new"), path_ + "/n");
    EXPECT_THAT(callsAfterChange(), UnorderedElementsAre(first, second));
    EXPECT_EQ(state(first), std::pair(0, 2UL));
    std::filesystem::remove(path_ + "/n");
    EXPECT_THAT(callsAfterChange(), UnorderedElementsAre(first, second));
    EXPECT_EQ(state(second), std::pair(ENOENT, 0UL));
    post("nobody", "1");
    post("other", "3");
    EXPECT_THAT(callsAfterChange(), ElementsAre(other));
    EXPECT_THAT(queue_.takePaces(), testing::Each(Pace::mayBlock));
    EXPECT_FALSE(isReadable(notifications_.fileDescriptor(), 0)) << "at rest";
    post("other", "4");
    int preparations = 0;
    notifications_.deliverPosts([&] {
        ++preparations;
        EXPECT_FALSE(isReadable(notifications_.fileDescriptor(), 0)) << "taken in";
        EXPECT_THAT(queue_.takePaces(), IsEmpty()) << "and not yet delivered";
    });
    EXPECT_EQ(preparations, 1);
    EXPECT_EQ(queue_.takePaces().size(), 1U);
}

TEST_F(NamedNotificationsTest, TheServicesOwnPostIsOneAndKeepsTheWord) {
    const int token = add("n");
    const std::pair<const char*, std::uint64_t> cases[] = {
        {nullptr, 0}, {" 18446744073709551615 ", UINT64_MAX}, {"1 2", 0}, {"", 0}};
    for (const auto& [text, word] : cases) {
        if (text != nullptr) {
            post("n", text);
            (void)callsAfterChange();
        }
        EXPECT_EQ(notifications_.PostNamedNotification("n"), 0);
        (void)queue_.takePaces();
        EXPECT_THAT(callsAfterChange(), ElementsAre(token));
        EXPECT_EQ(directory_.read("notifications/n"), std::to_string(word) + "\n");
    }
    EXPECT_THAT(log_.take(), IsEmpty());
}

TEST_F(NamedNotificationsTest, APostThatFailsIsToldOncePerOutage) {
    const std::string fault = "3 zrrs " + path_ + "/n: Is a directory; the notification is not posted";
    for (int outage = 0; outage < 2; ++outage) {
        std::filesystem::create_directory(path_ + "/n");
        EXPECT_EQ(notifications_.PostNamedNotification("n"), EISDIR);
        EXPECT_EQ(notifications_.PostNamedNotification("n"), EISDIR);
        std::filesystem::remove(path_ + "/n");
        EXPECT_EQ(notifications_.PostNamedNotification("n"), 0);
        std::filesystem::remove(path_ + "/n");
        EXPECT_THAT(log_.take(), ElementsAre(fault));
    }
    std::filesystem::create_symlink("n", path_ + "/link");
    EXPECT_EQ(notifications_.PostNamedNotification("link"), ELOOP);
    EXPECT_EQ(notifications_.PostNamedNotification(".n"), EINVAL);
}

TEST_F(NamedNotificationsTest, ABurstIsOneWaitingCallThatSeesTheLastState) {
    std::vector<std::uint64_t> seen;
    const int token = add("n", [&](int called) {
        seen.push_back(state(called).second);
        if (seen.size() == 1) {
            post("n", "8");
            deliver();
        }
    });
    post("n", "1000");
    for (int word = 1000; word <= 5000; ++word) {
        std::fstream(path_ + "/n") << word; // in place: emptying a file first makes a disk work
        if (word % 7 == 0) {
            deliver();
        }
    }
    deliver();
    EXPECT_EQ(queue_.takePaces().size(), 1U);
    queue_.runAll();
    EXPECT_THAT(seen, ElementsAre(5000, 8)) << "what comes while the handler runs is another call";
    EXPECT_EQ(state(token), std::pair(0, 8UL));
}

TEST_F(NamedNotificationsTest, APostThatTheKernelCouldNotRememberIsSeen) {
    const int token = add("n");
    int limit = 0;
    std::ifstream("/proc/sys/fs/inotify/max_queued_events") >> limit;
    if (limit <= 0 || limit > 100'000) {
        GTEST_SKIP() << "the kernel remembers " << limit;
    }
    post("a", "");
    post("b", "");
    for (int i = 0; i <= limit; ++i) { // taking turns, since a repetition of the last event is left out
        std::fstream(path_ + (i % 2 == 0 ? "/a" : "/b"));
    }
    post("n", "7");
    EXPECT_THAT(callsAfterChange(), ElementsAre(token));
    EXPECT_EQ(state(token), std::pair(0, 7UL));
}

TEST_F(NamedNotificationsTest, ThreadsPostReadAndRegisterAtOnce) {
    LinuxWorkQueues queues;
    const auto queue = queues.makeSerialQueue("notifications");
    constexpr std::uint64_t kLast = 300;
    std::promise<void> lastSeen;
    // Unguarded: the queue is the guard.
    std::vector<std::uint64_t> seen;
    bool isLastSeen = false;
    const auto handler = [&](int called) {
        const auto [status, word] = state(called);
        EXPECT_EQ(status, 0);
        seen.push_back(word);
        if (word == kLast && !std::exchange(isLastSeen, true)) {
            lastSeen.set_value();
        }
    };
    const int token = notifications_.RegisterNamedNotification("n", *queue, handler).token;
    std::atomic<bool> isDone{false};
    std::thread loop([&] {
        while (!isDone) {
            if (isReadable(notifications_.fileDescriptor(), 10)) {
                notifications_.deliverPosts();
            }
        }
    });
    std::thread others([&] {
        while (!isDone) {
            notifications_.CancelNamedNotification(
                notifications_.RegisterNamedNotification("n", queue_, [](int) {}).token);
            (void)notifications_.GetNamedNotificationState(token);
        }
    });
    for (std::uint64_t word = 1; word <= kLast; ++word) {
        directory_.write("new", std::to_string(word));
        std::filesystem::rename(directory_.path("new"), path_ + "/n");
    }
    EXPECT_EQ(lastSeen.get_future().wait_for(std::chrono::seconds(20)), std::future_status::ready);
    isDone = true;
    loop.join();
    others.join();
    std::promise<void> atRest;
    queue->post([&] {
        notifications_.CancelNamedNotification(token);
        atRest.set_value();
    });
    atRest.get_future().wait();
    EXPECT_TRUE(std::ranges::is_sorted(seen));
}

TEST_F(NamedNotificationsTest, NoCallFollowsACancellation) {
    const auto held = std::make_shared<int>();
    const int first = add("n", [held](int) {});
    const int itself = add("n", [this, held](int called) {
        notifications_.CancelNamedNotification(called);
        calls_.push_back(held != nullptr ? -1 : 0); // what it holds is still there
    });
    const int remaining = add("n");
    post("n", "1");
    deliver();
    notifications_.CancelNamedNotification(first); // its call waits on the queue
    notifications_.CancelNamedNotification(first);
    notifications_.CancelNamedNotification(4711);
    queue_.runAll();
    EXPECT_THAT(std::exchange(calls_, {}), ElementsAre(itself, -1, remaining));
    EXPECT_EQ(held.use_count(), 1) << "the handlers are gone";
    EXPECT_EQ(state(itself), std::pair(EBADF, 0UL));
    post("n", "2");
    EXPECT_THAT(callsAfterChange(), ElementsAre(remaining));
}

TEST_F(NamedNotificationsTest, CallsOutliveTheNotifications) {
    auto notifications = std::make_unique<LinuxNamedNotifications>(path_, log_);
    const auto registration = notifications->RegisterNamedNotification(
        "n", queue_, [this](int called) { calls_.push_back(called); });
    post("n", "1");
    notifications->deliverPosts();
    notifications.reset();
    queue_.runAll();
    EXPECT_THAT(calls_, ElementsAre(registration.token));
}

TEST_F(NamedNotificationsTest, TheDirectoryVanishesAndComesBack) {
    const int first = add("a"), second = add("b");
    post("a", "1");
    EXPECT_THAT(callsAfterChange(), ElementsAre(first));
    std::filesystem::rename(path_, directory_.path("away"));
    EXPECT_THAT(callsAfterChange(), ElementsAre(first, second));
    EXPECT_EQ(state(first), std::pair(ENOENT, 0UL));
    directory_.write("away/b", "2");
    std::filesystem::rename(directory_.path("away"), path_);
    EXPECT_THAT(callsAfterChange(), ElementsAre(first, second));
    EXPECT_EQ(state(second), std::pair(0, 2UL));
    std::filesystem::remove_all(path_);
    std::filesystem::create_directory(path_);
    EXPECT_THAT(callsAfterChange(), UnorderedElementsAre(first, second));
    post("b", "3");
    EXPECT_THAT(callsAfterChange(), ElementsAre(second));
    EXPECT_THAT(log_.take(), IsEmpty());
}

TEST_F(NamedNotificationsTest, ADirectoryThatCannotBeWatchedIsToldOnceAndTakenUpLater) {
    const int token = add("n");
    std::filesystem::remove(path_);
    std::filesystem::create_symlink("notifications", path_);
    EXPECT_THAT(callsAfterChange(), ElementsAre(token));
    directory_.write("unrelated", "1");
    const int another = add("n");
    EXPECT_EQ(state(another), std::pair(ELOOP, 0UL));
    EXPECT_THAT(log_.take(),
                ElementsAre(HasSubstr("3 zrrs " + path_ + ": Too many levels of symbolic links; "),
                            HasSubstr("3 zrrs " + path_ + "/n: Too many levels of symbolic links; ")));
    std::filesystem::remove(path_);
    std::filesystem::create_directory(path_);
    post("n", "7");
    EXPECT_THAT(callsAfterChange(), UnorderedElementsAre(token, another));
    post("n", "8");
    EXPECT_THAT(callsAfterChange(), UnorderedElementsAre(token, another));
    EXPECT_EQ(state(token), std::pair(0, 8UL));
    EXPECT_THAT(log_.take(), IsEmpty());
}

} // namespace
} // namespace tamblo
