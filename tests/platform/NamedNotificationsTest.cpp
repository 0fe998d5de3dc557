#include "platform/linux/loop/LinuxWorkQueues.h"
#include "platform/linux/settings/LinuxNamedNotifications.h"
#include "tests/fakes/FakeSerialQueue.h"
#include "tests/platform/LinuxServiceSupport.h"

#include <gmock/gmock.h>

#include <algorithm>
#include <atomic>
#include <cerrno>
#include <future>
#include <memory>
#include <thread>

#include <sys/stat.h>

namespace tamblo {
namespace {

namespace fs = std::filesystem;
using testing::ElementsAre;
using testing::HasSubstr;
using testing::IsEmpty;
using State = std::pair<int, std::uint64_t>;

class NamedNotificationsTest : public testing::Test {
protected:
    NamedNotificationsTest() {
        fs::create_directory(path_); // watched from before it is there
        deliver();
    }

    int add(std::string_view name, NamedNotifications::Handler handler) {
        return notifications_.RegisterNamedNotification(name, queue_, std::move(handler)).token;
    }
    /// A registration whose handler notes its call.
    int add(std::string_view name) {
        return add(name, [this](int called) { calls_.push_back(called); });
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
    [[nodiscard]] State state(int token) {
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
    EXPECT_EQ(state(token), State(ENOENT, 0));
    const struct {
        std::string text;
        int status;
        std::uint64_t word;
    } cases[] = {
        {"1", 0, 1},
        {" \t7\r\n", 0, 7},
        {"18446744073709551615\n", 0, UINT64_MAX},
        {"18446744073709551616", ERANGE, 0},
        {" \n", EBADMSG, 0},
        {"-1", EBADMSG, 0},
        {" 1 2", EBADMSG, 0},
        {std::string("1\0", 2), EBADMSG, 0},
        {std::string(256, ' ') + "1", EFBIG, 0},
        {std::string(255, ' ') + "1", 0, 1},
    };
    for (const auto& [text, status, word] : cases) {
        post("n", text);
        EXPECT_EQ(state(token), State(status, word)) << text;
        EXPECT_EQ(state(token).first, status);
        const bool isRubbish = status != 0 && text.find_first_not_of(" \n") != std::string::npos;
        EXPECT_EQ(log_.take().size(), isRubbish ? 1U : 0U) << text;
    }
    post("n", " 1 2");
    (void)state(token);
    EXPECT_THAT(log_.take(), ElementsAre("3 zrrs " + path_ +
                                         "/n: byte 2: not a 64-bit number in decimal; it is not used"));
    EXPECT_EQ(state(token + 1), State(EBADF, 0));
    ASSERT_EQ(::mkfifo((path_ + "/pipe").c_str(), 0600), 0);
    fs::create_symlink("n", path_ + "/link");
    EXPECT_EQ(state(add("pipe")), State(EINVAL, 0));
    EXPECT_EQ(state(add("link")), State(ELOOP, 0));
}

TEST_F(NamedNotificationsTest, APostCallsEachRegistrationOfItsName) {
    const int first = add("n"), second = add("n"), other = add("other");
    for (int repeat = 0; repeat < 2; ++repeat) { // the same word again
        post("n", "1");
        EXPECT_THAT(callsAfterChange(), ElementsAre(first, second));
    }
    fs::remove(path_ + "/n");
    EXPECT_THAT(callsAfterChange(), ElementsAre(first, second));
    EXPECT_EQ(state(second), State(ENOENT, 0));
    post("nobody", "1");
    post("other", "3");
    EXPECT_THAT(callsAfterChange(), ElementsAre(other));
    EXPECT_THAT(queue_.takePaces(), testing::Each(Pace::mayBlock));
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
        EXPECT_THAT(callsAfterChange(), ElementsAre(token));
        EXPECT_EQ(directory_.read("notifications/n"), std::to_string(word) + "\n");
    }
    fs::remove(path_ + "/n");
    EXPECT_THAT(log_.take(), IsEmpty());
    for (int outage = 0; outage < 2; ++outage) {
        fs::create_directory(path_ + "/n");
        EXPECT_EQ(notifications_.PostNamedNotification("n"), EISDIR);
        EXPECT_EQ(notifications_.PostNamedNotification("n"), EISDIR);
        fs::remove(path_ + "/n");
        EXPECT_EQ(notifications_.PostNamedNotification("n"), 0);
        fs::remove(path_ + "/n");
        EXPECT_THAT(log_.take(),
                    ElementsAre("3 zrrs " + path_ + "/n: Is a directory; the notification is not posted"));
    }
    fs::create_symlink("n", path_ + "/link");
    EXPECT_EQ(notifications_.PostNamedNotification("link"), ELOOP);
}

TEST_F(NamedNotificationsTest, ANameIsThatOfAFileOfItsOwn) {
    using namespace std::string_view_literals;
    EXPECT_GT(add(std::string(255, 'x')), 0);
    for (const std::string_view name : {""sv, ".n"sv, "../n"sv, "a\0b"sv, "a/b"sv}) {
        EXPECT_EQ(notifications_.RegisterNamedNotification(name, queue_, [](int) {}).status, EINVAL) << name;
        EXPECT_EQ(notifications_.PostNamedNotification(name), EINVAL) << name;
    }
    EXPECT_EQ(notifications_.PostNamedNotification(std::string(256, 'x')), ENAMETOOLONG);
}

TEST_F(NamedNotificationsTest, ABurstIsOneWaitingCallThatSeesTheLastState) {
    std::vector<std::uint64_t> seen;
    add("n", [&](int called) {
        seen.push_back(state(called).second);
        if (seen.size() == 1) {
            post("n", "8");
            deliver();
        }
    });
    for (int word = 1; word <= 100; ++word) {
        post("n", std::to_string(word));
        if (word % 7 == 0) {
            deliver();
        }
    }
    deliver();
    EXPECT_EQ(queue_.takePaces().size(), 1U);
    queue_.runAll();
    EXPECT_THAT(seen, ElementsAre(100, 8)) << "what comes while the handler runs is another call";
}

TEST_F(NamedNotificationsTest, ThreadsPostReadAndRegisterAtOnce) {
    LinuxWorkQueues queues;
    const auto queue = queues.makeSerialQueue("notifications");
    constexpr std::uint64_t kLast = 300;
    std::atomic<bool> isDone{false};
    // Unguarded: the queue is the guard.
    std::vector<std::uint64_t> seen;
    const auto handler = [&](int called) {
        seen.push_back(state(called).second);
        isDone = isDone || seen.back() == kLast;
    };
    const int token = notifications_.RegisterNamedNotification("n", *queue, handler).token;
    std::thread others([&] {
        while (!isDone) {
            notifications_.CancelNamedNotification(
                notifications_.RegisterNamedNotification("n", queue_, [](int) {}).token);
            (void)notifications_.GetNamedNotificationState(token);
        }
    });
    std::thread poster([&] {
        for (std::uint64_t word = 1; word <= kLast; ++word) {
            directory_.write("new", std::to_string(word));
            fs::rename(directory_.path("new"), path_ + "/n");
        }
    });
    for (int wait = 0; wait < 2000 && !isDone; ++wait) {
        if (isReadable(notifications_.fileDescriptor(), 10)) {
            notifications_.deliverPosts();
        }
    }
    EXPECT_TRUE(isDone.exchange(true)) << "the last word is seen";
    poster.join();
    others.join();
    std::promise<void> atRest;
    queue->post([&] {
        notifications_.CancelNamedNotification(token);
        atRest.set_value();
    });
    atRest.get_future().wait();
    EXPECT_TRUE(std::ranges::is_sorted(seen));
}

TEST_F(NamedNotificationsTest, NoCallFollowsACancellationOrTheirEnd) {
    const auto held = std::make_shared<int>();
    const int first = add("n", [held](int) {});
    add("n", [this, held](int called) {
        notifications_.CancelNamedNotification(called);
        calls_.push_back(held != nullptr ? -1 : 0); // what it holds is still there
    });
    const int remaining = add("n");
    auto others = std::make_unique<LinuxNamedNotifications>(path_, log_);
    (void)others->RegisterNamedNotification("n", queue_, [held](int) { FAIL(); });
    post("n", "1");
    deliver();
    others->deliverPosts();
    EXPECT_EQ(queue_.takePaces().size(), 4U);
    notifications_.CancelNamedNotification(first); // its call waits on the queue
    notifications_.CancelNamedNotification(first);
    notifications_.CancelNamedNotification(4711);
    others.reset();
    queue_.runAll();
    EXPECT_THAT(std::exchange(calls_, {}), ElementsAre(-1, remaining));
    EXPECT_EQ(held.use_count(), 1) << "the handlers are gone";
    EXPECT_EQ(state(first), State(EBADF, 0));
    post("n", "2");
    EXPECT_THAT(callsAfterChange(), ElementsAre(remaining));
}

TEST_F(NamedNotificationsTest, AnythingMayHaveChangedWhenTheDirectoryComesOrGoes) {
    const int first = add("a"), second = add("b");
    fs::remove(path_);
    fs::create_symlink("notifications", path_);
    EXPECT_THAT(callsAfterChange(), ElementsAre(first, second));
    directory_.write("unrelated", "1");
    EXPECT_EQ(state(first), State(ELOOP, 0));
    EXPECT_THAT(log_.take(),
                ElementsAre(HasSubstr("3 zrrs " + path_ + ": Too many levels of symbolic links; "),
                            HasSubstr("3 zrrs " + path_ + "/a: Too many levels of symbolic links; ")));
    fs::remove(path_);
    fs::create_directory(path_);
    post("b", "7");
    EXPECT_THAT(callsAfterChange(), ElementsAre(first, second));
    EXPECT_EQ(state(second), State(0, 7));
    EXPECT_THAT(log_.take(), IsEmpty());
}

} // namespace
} // namespace tamblo
