#include "os/Directory.h"
#include "platform/linux/settings/JsonFile.h"
#include "platform/linux/settings/LinuxDeviceProperties.h"
#include "platform/linux/settings/LinuxNamedNotifications.h"
#include "platform/linux/settings/LinuxPreferences.h"
#include "tests/fakes/FakeWorkQueues.h"
#include "tests/platform/LinuxServiceSupport.h"

#include <sys/file.h>
#include <sys/resource.h>

namespace tamblo {
namespace {

namespace fs = std::filesystem;
using namespace testing;

TEST(JsonFileTest, WhatIsWrongIsAbsentAndToldOncePerState) {
    const TemporaryDirectory directory;
    FakeLog log;
    JsonFile file(directory.path("f.json"), 100);
    EXPECT_EQ(file.read(log), std::nullopt);
    EXPECT_THAT(log.take(), IsEmpty()) << "a missing file is no fault";
    const std::pair<std::string, const char*> cases[] = {
        {"{\n  \"k\": 1,\n  oops}", "f.json: line 3, column 3: "},
        {std::string(101, ' '), "File too large"},
    };
    for (const auto& [content, fault] : cases) {
        directory.write("f.json", content);
        EXPECT_EQ(file.read(log), std::nullopt);
        EXPECT_EQ(file.read(log), std::nullopt);
        EXPECT_THAT(log.take(), ElementsAre(HasSubstr(fault)));
    }
    directory.write("f.json", R"({"k": 6, "none": null})");
    EXPECT_EQ(file.read(log), (Dictionary{{"k", 6}}));
    directory.write("f.json", "[1, null, {}]");
    EXPECT_EQ(file.read(log), std::nullopt);
    EXPECT_THAT(log.take(), SizeIs(1)) << "told anew after it was well";
}

class LinuxPreferencesTest : public Test {
protected:
    LinuxPreferencesTest() { fs::create_directory(path_); }

    void write(const std::string& content) const { directory_.write("preferences/d.json", content); }
    std::string content() const { return directory_.read("preferences/d.json"); }
    void takeInChange() {
        const std::uint64_t before = preferences_.generation();
        while (isReadable(preferences_.fileDescriptor(), preferences_.generation() == before ? 2000 : 0)) {
            preferences_.readChanges();
        }
        EXPECT_NE(preferences_.generation(), before);
    }
    /// What is in force, or -1.
    std::int64_t value() const {
        const std::optional<Value> value = preferences_.copyPreferenceValue("k", "d");
        return value ? value->integerValue() : -1;
    }
    std::int64_t valueAfterChange() {
        takeInChange();
        return value();
    }
    void set(std::string_view key, int value) { preferences_.setPreferenceValue(key, "d", value); }

    TemporaryDirectory directory_;
    const std::string path_ = directory_.path("preferences");
    FakeLog log_;
    std::chrono::steady_clock::time_point now_;
    LinuxPreferences preferences_{path_, log_, [this] { return now_; }};
};

TEST_F(LinuxPreferencesTest, WhatCannotBeReadStaysAsItWasAndIsTriedAgainWithoutAChange) {
    write(R"({"k": 1})");
    EXPECT_EQ(valueAfterChange(), 1);
    directory_.write("properties", R"({"p": true})");
    const LinuxDeviceProperties properties(directory_.path("properties"), log_);
    EXPECT_EQ(properties.booleanProperty("p"), true);
    write(R"({"k": 2})");
    directory_.write("properties", R"({"p": false, "q": 1})");
    rlimit limit{};
    ::getrlimit(RLIMIT_NOFILE, &limit);
    const rlimit standardOnes{3, limit.rlim_max};
    ::setrlimit(RLIMIT_NOFILE, &standardOnes);
    EXPECT_EQ(valueAfterChange(), 1);
    EXPECT_EQ(value(), 1);
    EXPECT_EQ(properties.booleanProperty("p"), true);
    ::setrlimit(RLIMIT_NOFILE, &limit);
    const std::uint64_t before = preferences_.generation();
    EXPECT_EQ(value(), 1) << "left alone for a while";
    now_ += std::chrono::seconds(1);
    EXPECT_NE(preferences_.generation(), before) << "what was worked out is out of date";
    EXPECT_EQ(value(), 2);
    EXPECT_EQ(properties.booleanProperty("p"), false);
    EXPECT_THAT(log_.take(), ElementsAre(HasSubstr("d.json: Too many open files; what was known of it stays"),
                                         HasSubstr("properties: Too many open files; what was known")));

    fs::remove(path_ + "/d.json");
    fs::create_symlink("d.json", path_ + "/loop");
    fs::rename(path_ + "/loop", path_ + "/d.json");
    EXPECT_EQ(valueAfterChange(), 2);
    directory_.write("new", R"({"k": 3})");
    fs::rename(directory_.path("new"), path_ + "/d.json");
    EXPECT_EQ(valueAfterChange(), 3) << "at once, where there is a change";
}

TEST_F(LinuxPreferencesTest, FollowTheFiles) {
    EXPECT_EQ(value(), -1);
    write(R"({"k": 1})");
    EXPECT_EQ(valueAfterChange(), 1);
    write(R"({"a": [1], "k": 2})");
    EXPECT_EQ(value(), 1) << "read once, until a change is told";
    EXPECT_EQ(valueAfterChange(), 2);
    EXPECT_THAT(log_.take(), IsEmpty());
    const std::uint64_t before = preferences_.generation();
    directory_.write("preferences/notes.txt", "x");
    ASSERT_TRUE(isReadable(preferences_.fileDescriptor()));
    preferences_.readChanges();
    EXPECT_EQ(preferences_.generation(), before) << "no preference";
    set("k", 3);
    EXPECT_NE(preferences_.generation(), before);
    EXPECT_EQ(value(), 3);
    EXPECT_EQ(content(), "{\"a\":[1],\"k\":3}\n");
}

TEST_F(LinuxPreferencesTest, WhatCannotBeStoredIsToldOnceAndInForceUntilTheFileChanges) {
    const auto locked = lockDirectory(path_, {});
    for (const char* const fault : {"another program has it locked", "d.json: line 1"}) {
        for (const int number : {7, 8}) {
            set("k", number);
            EXPECT_EQ(value(), number);
        }
        EXPECT_THAT(log_.take(),
                    ElementsAre(AllOf(HasSubstr(fault), HasSubstr("forgotten when the service ends"))));
        write("{oops}");
        takeInChange();
        ::flock(locked.get(), LOCK_UN);
    }
    EXPECT_EQ(content(), "{oops}");
    write(R"({"k": 1})");
    EXPECT_EQ(valueAfterChange(), 1);
    set("k", 2);
    EXPECT_EQ(value(), 2);
    EXPECT_THAT(log_.take(), IsEmpty());
}

using State = std::pair<int, std::uint64_t>;

class NamedNotificationsTest : public Test {
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
    /// The changes that must have come.
    void deliver() {
        EXPECT_TRUE(isReadable(notifications_.fileDescriptor()));
        while (isReadable(notifications_.fileDescriptor(), 0)) {
            notifications_.deliverPosts();
        }
    }
    /// The tokens of the handlers that a change had called.
    std::vector<int> callsAfterChange() {
        deliver();
        queue_.runAll();
        return std::exchange(calls_, {});
    }
    State state(int token) {
        const auto found = notifications_.GetNamedNotificationState(token);
        return {found.status, found.word};
    }

    TemporaryDirectory directory_;
    const std::string path_ = directory_.path("notifications");
    FakeLog log_;
    // Before the queue, which runs what waits when it goes.
    std::vector<int> calls_;
    LinuxNamedNotifications notifications_{path_, log_};
    FakeSerialQueue queue_{"test"};
};

TEST_F(NamedNotificationsTest, ReadsTheWordThatStandsInTheFile) {
    const int token = add("n");
    EXPECT_EQ(state(token), State(ENOENT, 0));
    const std::pair<std::string, State> cases[] = {
        {" \t7\r\n", {0, 7}},
        {"18446744073709551615\n", {0, UINT64_MAX}},
        {"18446744073709551616", {ERANGE, 0}},
        {" \n", {EBADMSG, 0}},
        {"-1", {EBADMSG, 0}},
        {std::string("1\0", 2), {EBADMSG, 0}},
        {std::string(256, ' ') + "1", {EFBIG, 0}},
        {std::string(255, ' ') + "1", {0, 1}},
    };
    for (const auto& [text, expected] : cases) {
        post("n", text);
        EXPECT_EQ(state(token), expected) << text;
        EXPECT_EQ(state(token), expected) << text;
        const bool isRubbish = expected.first != 0 && text != " \n"; // its writer may have just begun
        EXPECT_THAT(log_.take(), SizeIs(isRubbish ? 1 : 0)) << text;
    }
    ASSERT_EQ(::mkfifo((path_ + "/pipe").c_str(), 0600), 0);
    fs::create_symlink("n", path_ + "/link");
    EXPECT_EQ(state(add("pipe")), State(EINVAL, 0));
    EXPECT_EQ(state(add("link")), State(ELOOP, 0));
}

TEST_F(NamedNotificationsTest, APostCallsEachRegistrationOfItsName) {
    const int first = add("n"), second = add("n"), other = add("other");
    for (const char* word : {"1", "1"}) {
        post("n", word);
        EXPECT_THAT(callsAfterChange(), ElementsAre(first, second));
    }
    directory_.write("new", "2");
    fs::rename(directory_.path("new"), path_ + "/n");
    EXPECT_THAT(callsAfterChange(), ElementsAre(first, second));
    // Neither its end nor a name that it gets elsewhere is a post.
    fs::rename(path_ + "/n", directory_.path("away"));
    EXPECT_EQ(state(second), State(ENOENT, 0));
    post("other", "2");
    fs::remove(path_ + "/other");
    EXPECT_THAT(callsAfterChange(), ElementsAre(other));
    post("nobody", "1");
    post("other", "3");
    EXPECT_THAT(callsAfterChange(), ElementsAre(other));
    EXPECT_THAT(queue_.takePaces(), Each(Pace::mayBlock));
    post("other", "4");
    notifications_.deliverPosts([&] {
        EXPECT_FALSE(isReadable(notifications_.fileDescriptor(), 0)) << "taken in";
        EXPECT_THAT(queue_.takePaces(), IsEmpty()) << "and not yet delivered";
    });
    EXPECT_THAT(queue_.takePaces(), SizeIs(1));
}

TEST_F(NamedNotificationsTest, TheServicesOwnPostIsOneAndKeepsTheWord) {
    const int token = add("n");
    EXPECT_EQ(notifications_.PostNamedNotification("n"), 0);
    EXPECT_THAT(callsAfterChange(), ElementsAre(token));
    EXPECT_EQ(directory_.read("notifications/n"), "0\n");
    for (const auto& [text, word] : {std::pair(" 18446744073709551615 ", UINT64_MAX), {"1 2", 0}, {"", 0}}) {
        post("n", text);
        (void)callsAfterChange();
        EXPECT_EQ(notifications_.PostNamedNotification("n"), 0);
        EXPECT_THAT(callsAfterChange(), ElementsAre(token));
        EXPECT_EQ(directory_.read("notifications/n"), std::to_string(word) + "\n");
    }
    EXPECT_THAT(log_.take(), IsEmpty());
    fs::create_symlink("n", path_ + "/link");
    EXPECT_EQ(notifications_.PostNamedNotification("link"), ELOOP);
    EXPECT_THAT(log_.take(), ElementsAre(HasSubstr("links; the notification is not posted")));
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
    for (const char* word : {"1", "2", "3"}) {
        post("n", word);
        deliver();
    }
    EXPECT_THAT(queue_.takePaces(), SizeIs(1));
    queue_.runAll();
    EXPECT_THAT(seen, ElementsAre(3, 8)) << "what comes while the handler runs is another call";
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
    EXPECT_THAT(queue_.takePaces(), SizeIs(4));
    notifications_.CancelNamedNotification(first); // its call waits on the queue
    notifications_.CancelNamedNotification(first);
    others.reset();
    queue_.runAll();
    EXPECT_THAT(std::exchange(calls_, {}), ElementsAre(-1, remaining));
    EXPECT_EQ(held.use_count(), 1) << "the handlers are gone";
    EXPECT_EQ(state(first), State(EBADF, 0));
    post("n", "2");
    EXPECT_THAT(callsAfterChange(), ElementsAre(remaining));
}

TEST_F(NamedNotificationsTest, WhatIsThereMayHaveBeenPostedWhenTheDirectoryComesBack) {
    const int first = add("a");
    add("b");
    fs::rename(path_, directory_.path("away"));
    EXPECT_THAT(callsAfterChange(), IsEmpty());
    directory_.write("away/a", "1");
    fs::rename(directory_.path("away"), path_);
    EXPECT_THAT(callsAfterChange(), ElementsAre(first));
    fs::remove_all(path_);
    fs::create_symlink("notifications", path_);
    EXPECT_THAT(callsAfterChange(), IsEmpty());
    EXPECT_EQ(state(first), State(ELOOP, 0));
    EXPECT_THAT(log_.take(), ElementsAre(HasSubstr("/notifications: Too many levels of symbolic links; "),
                                         HasSubstr("/a: Too many levels of symbolic links; ")));
}

} // namespace
} // namespace tamblo
