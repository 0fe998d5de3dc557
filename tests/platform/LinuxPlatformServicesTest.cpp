#include "platform/linux/Directories.h"
#include "platform/linux/device/LinuxClock.h"
#include "platform/linux/device/LinuxProcessInformation.h"
#include "platform/linux/log/LinuxStructuredLog.h"
#include "platform/linux/log/LinuxTracePoints.h"
#include "platform/linux/settings/LinuxDeviceProperties.h"
#include "platform/linux/settings/LinuxPreferences.h"
#include "platform/linux/sinks/LinuxAnalyticsEventService.h"
#include "tests/platform/LinuxServiceSupport.h"

#include <gmock/gmock.h>

#include <array>
#include <cstdlib>
#include <ctime>
#include <map>
#include <utility>

#include <fcntl.h>
#include <poll.h>
#include <sys/socket.h>
#include <unistd.h>

namespace tamblo {
namespace {

using namespace std::string_view_literals;
using testing::AllOf;
using testing::ElementsAre;
using testing::HasSubstr;
using testing::IsEmpty;

bool isReadable(int descriptor, int milliseconds = 2000) {
    pollfd question{descriptor, POLLIN, 0};
    return ::poll(&question, 1, milliseconds) == 1;
}

TEST(LinuxClockTest, TheOffsetIsThatOfTheZoneOfTheMoment) {
    const char* before = ::getenv("TZ");
    const std::string zone = before != nullptr ? before : "";
    constexpr std::pair<const char*, int> cases[] = {{"ABC-5:45", 20'700}, {"ABC3:30", -12'600}};
    for (const auto& [name, offset] : cases) {
        ::setenv("TZ", name, 1);
        EXPECT_EQ(LinuxClock().utcOffset(WallTime()).count(), offset) << name;
    }
    before != nullptr ? ::setenv("TZ", zone.c_str(), 1) : ::unsetenv("TZ");
    ::tzset();
}

TEST(DirectoriesTest, ComeFromTheUnitOrFromTheirUsualPlaces) {
    using Variables = std::map<std::string, std::string, std::less<>>;
    const struct {
        Variables variables;
        bool isRoot;
        std::string home, runtime, configuration, logs;
    } cases[] = {
        {{}, true, "/root", "/run/tamblo", "/etc/tamblo", "/var/log/tamblo"},
        {{{"RUNTIME_DIRECTORY", "/a:/b"}, {"CONFIGURATION_DIRECTORY", "/c/"}, {"LOGS_DIRECTORY", "/l"}},
         true,
         "",
         "/a",
         "/c",
         "/l"},
        {{{"XDG_RUNTIME_DIR", "/run/user/7"}, {"LOGS_DIRECTORY", ""}},
         false,
         "/home/u",
         "/run/user/7/tamblo",
         "/home/u/.config/tamblo",
         "/home/u/.local/state/tamblo"},
        {{{"XDG_RUNTIME_DIR", "/r/"}, {"XDG_CONFIG_HOME", "relative"}, {"XDG_STATE_HOME", "/s"}},
         false,
         "/h",
         "/r/tamblo",
         "/h/.config/tamblo",
         "/s/tamblo"},
    };
    for (const auto& [variables, isRoot, home, runtime, configuration, logs] : cases) {
        const auto variable = [&variables](std::string_view name) {
            const auto found = variables.find(name);
            return found == variables.end() ? std::string() : found->second;
        };
        const auto found = Directories::find({variable, isRoot, home});
        ASSERT_TRUE(std::holds_alternative<Directories>(found)) << std::get<std::string>(found);
        const auto& directories = std::get<Directories>(found);
        EXPECT_THAT((std::array{directories.runtime, directories.configuration, directories.logs}),
                    ElementsAre(runtime, configuration, logs));
    }
    const auto nowhere = Directories::find({[](std::string_view) { return std::string(); }, false, "/h"});
    EXPECT_THAT(std::get<std::string>(nowhere),
                AllOf(HasSubstr("RUNTIME_DIRECTORY"), HasSubstr("XDG_RUNTIME_DIR")));
}

TEST(DirectoriesTest, AreCreatedForTheirOwnerAloneOrSayWhyNot) {
    const TemporaryDirectory home;
    const auto variable = [&home](std::string_view name) {
        return name == "LOGS_DIRECTORY" ? home.path("logs/deep") : home.path("x") + "/" + std::string(name);
    };
    const auto made = Directories::prepare({variable, false, ""});
    ASSERT_TRUE(std::holds_alternative<Directories>(made)) << std::get<std::string>(made);
    const auto& directories = std::get<Directories>(made);
    for (const std::string& path : {directories.logs, home.path("logs"), directories.notifications(),
                                    directories.driverChannels(), directories.preferences()}) {
        EXPECT_EQ(std::filesystem::status(path).permissions(), std::filesystem::perms::owner_all) << path;
    }
    EXPECT_TRUE(std::holds_alternative<Directories>(Directories::prepare({variable, false, ""})))
        << "all exist";
    std::filesystem::remove_all(home.path("logs"));
    home.write("logs", "a file");
    EXPECT_THAT(
        std::get<std::string>(Directories::prepare({variable, false, ""})),
        AllOf(HasSubstr(home.path("logs/deep")), HasSubstr("Not a directory"), HasSubstr("LOGS_DIRECTORY")));
}

class LinuxPreferencesTest : public testing::Test {
protected:
    LinuxPreferencesTest() { std::filesystem::create_directory(path_); }

    /// The integer that is stored now, or -1; first takes in the changes that must have come.
    std::int64_t valueAfterChange(const std::string& key = "k") {
        const std::uint64_t before = preferences_.generation();
        while (isReadable(preferences_.fileDescriptor(), preferences_.generation() == before ? 2000 : 0)) {
            preferences_.readChanges();
        }
        EXPECT_NE(preferences_.generation(), before);
        return value(key);
    }
    [[nodiscard]] std::int64_t value(std::string_view key = "k", std::string_view domain = "d") const {
        const std::optional<Value> value = preferences_.copyPreferenceValue(key, domain);
        return value ? value->integerValue() : -1;
    }

    TemporaryDirectory directory_;
    const std::string path_ = directory_.path("preferences");
    RecordingLog log_;
    LinuxPreferences preferences_{path_, log_};
};

TEST_F(LinuxPreferencesTest, FollowTheFilesThroughEveryKindOfChange) {
    EXPECT_EQ(value(), -1);
    directory_.write("preferences/d.json", R"({"k": 1})");
    EXPECT_EQ(valueAfterChange(), 1);
    EXPECT_EQ(value("other"), -1);
    directory_.write("new", R"({"k": 2})");
    std::filesystem::rename(directory_.path("new"), path_ + "/d.json");
    EXPECT_EQ(valueAfterChange(), 2);
    std::filesystem::rename(path_ + "/d.json", directory_.path("old"));
    EXPECT_EQ(valueAfterChange(), -1);
    std::filesystem::rename(directory_.path("old"), path_ + "/d.json");
    EXPECT_EQ(valueAfterChange(), 2);
    std::filesystem::remove(path_ + "/d.json");
    EXPECT_EQ(valueAfterChange(), -1);
    EXPECT_THAT(log_.take(), IsEmpty());
    const std::uint64_t before = preferences_.generation();
    directory_.write("preferences/notes.txt", "x");
    ASSERT_TRUE(isReadable(preferences_.fileDescriptor()));
    preferences_.readChanges();
    EXPECT_EQ(preferences_.generation(), before) << "no preference";
}

TEST_F(LinuxPreferencesTest, SurviveTheDirectoryVanishingAndComingBack) {
    directory_.write("preferences/d.json", R"({"k": 1})");
    EXPECT_EQ(valueAfterChange(), 1);
    std::filesystem::rename(path_, directory_.path("away"));
    EXPECT_EQ(valueAfterChange(), -1);
    directory_.write("away/d.json", R"({"k": 2})");
    std::filesystem::rename(directory_.path("away"), path_);
    EXPECT_EQ(valueAfterChange(), 2);
    directory_.write("preferences/d.json", R"({"k": 3})");
    EXPECT_EQ(valueAfterChange(), 3);
    // Even while somebody stays in it, which holds back the kernel's word that it is gone.
    const FileDescriptor user(::open(path_.c_str(), O_RDONLY | O_DIRECTORY));
    std::filesystem::remove_all(path_);
    std::filesystem::create_directory(path_);
    EXPECT_EQ(valueAfterChange(), -1);
    directory_.write("preferences/d.json", R"({"k": 4})");
    EXPECT_EQ(valueAfterChange(), 4);
}

TEST_F(LinuxPreferencesTest, ADirectoryBelowMissingParentsIsNoticed) {
    LinuxPreferences preferences(directory_.path("a/b/c"), log_);
    for (const char* step : {"a", "a/b", "a/b/c"}) {
        std::filesystem::create_directory(directory_.path(step));
        ASSERT_TRUE(isReadable(preferences.fileDescriptor())) << step;
        preferences.readChanges();
    }
    directory_.write("a/b/c/d.json", R"({"k": 5})");
    ASSERT_TRUE(isReadable(preferences.fileDescriptor()));
    preferences.readChanges();
    EXPECT_EQ(preferences.copyPreferenceValue("k", "d"), Value(5));
}

TEST_F(LinuxPreferencesTest, AMalformedFileIsAbsentAndToldOncePerState) {
    directory_.write("preferences/d.json", "{\n  \"k\": 1,\n  oops}");
    EXPECT_EQ(valueAfterChange(), -1);
    EXPECT_EQ(value(), -1);
    EXPECT_THAT(log_.take(), ElementsAre(AllOf(HasSubstr("3 zrrs " + path_ + "/d.json: line 3, column 3"))));
    std::filesystem::rename(path_, directory_.path("away"));
    std::filesystem::rename(directory_.path("away"), path_); // "anything may have changed", but it has not
    EXPECT_EQ(valueAfterChange(), -1);
    EXPECT_THAT(log_.take(), IsEmpty());
    directory_.write("preferences/d.json", "[1]");
    EXPECT_EQ(valueAfterChange(), -1);
    EXPECT_THAT(log_.take(), ElementsAre(HasSubstr("not an object")));
    directory_.write("preferences/d.json", R"({"k": 6})");
    EXPECT_EQ(valueAfterChange(), 6);
}

TEST_F(LinuxPreferencesTest, AValueIsStoredAtOnceBesideTheOthers) {
    namespace fs = std::filesystem;
    directory_.write("preferences/d.json", R"({"a":[1], "k":1})");
    fs::permissions(path_ + "/d.json", fs::perms(0640));
    EXPECT_EQ(valueAfterChange(), 1);
    EXPECT_EQ(preferences_.setPreferenceValue("k", "d", 2), std::nullopt);
    EXPECT_EQ(value(), 2) << "before the kernel has told of it";
    EXPECT_EQ(directory_.read("preferences/d.json"), "{\"a\":[1],\"k\":2}\n");
    EXPECT_EQ(valueAfterChange(), 2);
    EXPECT_EQ(preferences_.setPreferenceValue("k", "new", 1772366400.25), std::nullopt);
    EXPECT_EQ(directory_.read("preferences/new.json"), "{\"k\":1772366400.25}\n");
    EXPECT_EQ(fs::status(path_ + "/d.json").permissions(), fs::perms(0640));
    EXPECT_EQ(fs::status(path_ + "/new.json").permissions(), fs::perms(0600));
    EXPECT_EQ(std::distance(fs::directory_iterator(path_), fs::directory_iterator()), 2) << "nothing else";
}

TEST_F(LinuxPreferencesTest, WhatCannotBeStoredIsReadUntilTheFileChanges) {
    for (const auto& [content, fault] :
         {std::pair("{\"k\": 1,\n oops}", "line 2, column 2"), {"[1]", "no"}}) {
        directory_.write("preferences/d.json", content);
        EXPECT_EQ(valueAfterChange(), -1);
        EXPECT_THAT(preferences_.setPreferenceValue("k", "d", 7).value_or(""),
                    AllOf(HasSubstr(path_ + "/d.json: "), HasSubstr(fault)));
        EXPECT_EQ(directory_.read("preferences/d.json"), content);
        EXPECT_EQ(value(), 7);
        directory_.write("preferences/d.json", R"({"k": 1})");
        EXPECT_EQ(valueAfterChange(), 1);
    }
    std::filesystem::remove_all(path_);
    EXPECT_EQ(valueAfterChange(), -1);
    EXPECT_THAT(preferences_.setPreferenceValue("k", "d", 7).value_or(""), HasSubstr("No such file"));
    EXPECT_EQ(value(), 7);
    EXPECT_THAT(preferences_.setPreferenceValue("k", "../d", 7).value_or(""),
                HasSubstr("no preferences domain"));
}

TEST_F(LinuxPreferencesTest, ADomainNameIsNoPath) {
    directory_.write("outside.json", R"({"k": 1})");
    directory_.write("preferences/.hidden.json", R"({"k": 1})");
    for (const std::string_view domain : {"../outside"sv, ".hidden"sv, ""sv, "d\0x"sv, "/etc/x"sv}) {
        EXPECT_EQ(value("k", domain), -1) << domain;
    }
    EXPECT_THAT(log_.take(), IsEmpty());
}

TEST(LinuxDevicePropertiesTest, AreReadAgainWhenTheFileChanges) {
    const TemporaryDirectory directory;
    RecordingLog log;
    const LinuxDeviceProperties properties(directory.path("p.json"), log);
    EXPECT_EQ(properties.booleanProperty("InternalBuild"), std::nullopt);
    const std::pair<const char*, std::optional<bool>> cases[] = {
        {R"({"InternalBuild":true })", true}, {R"({"InternalBuild":false})", false},
        {R"({"InternalBuild":1})", {}},       {R"({"InternalBuild":true)", {}},
        {R"({"InternalBuild":true})", true},
    };
    for (const auto& [text, expected] : cases) {
        directory.write("p.json", text);
        EXPECT_EQ(properties.booleanProperty("InternalBuild"), expected) << text;
        EXPECT_EQ(properties.booleanProperty("InternalBuild"), expected) << text;
    }
    EXPECT_THAT(log.take(), ElementsAre(HasSubstr("p.json: InternalBuild is no boolean"),
                                        HasSubstr("p.json: line 1, column")));
    std::filesystem::remove(directory.path("p.json"));
    EXPECT_EQ(properties.booleanProperty("InternalBuild"), std::nullopt);
}

class SteppingClock final : public Clock {
public:
    [[nodiscard]] WallTime now() const noexcept override {
        return WallTime(std::chrono::milliseconds(250 * ++reads_));
    }
    [[nodiscard]] std::chrono::seconds utcOffset(WallTime) const override { return {}; }

    void sleepFor(std::chrono::microseconds) override {}

private:
    mutable int reads_ = 0;
};

class LinuxAnalyticsEventServiceTest : public LinuxPreferencesTest {
protected:
    void useEvents(const std::string& patterns) {
        directory_.write("preferences/com.vandra.tamblo.analytics.json",
                         R"({"events_in_use":)" + patterns + "}");
        valueAfterChange();
    }
    SteppingClock clock_;
    LinuxAnalyticsEventService events_{directory_.path(), clock_, preferences_, log_};
};

TEST_F(LinuxAnalyticsEventServiceTest, AnswersWhichEventsAreInUse) {
    const struct {
        const char *patterns, *inUse, *notInUse;
    } cases[] = {
        {R"(["a.b", "c.*"])", "a.b c. c.d", "a.bc a c cd"},
        {R"(["*"])", "a x", ""},
        {"[]", "", "a.b c.d"},
        {R"(["a*", "a.b*c", "*d"])", "a a.b", "d xd"},
        {R"("a")", "a zz", ""},
        {R"([1, "1x"])", "1x", "1 a"},
    };
    EXPECT_TRUE(events_.isEventInUse("a.b"));
    for (const auto& [patterns, inUse, notInUse] : cases) {
        useEvents(patterns);
        for (int repeat = 0; repeat < 2; ++repeat) { // worked out, then remembered
            std::istringstream yes(inUse), no(notInUse);
            for (std::string name; yes >> name;) {
                EXPECT_TRUE(events_.isEventInUse(name)) << patterns << " " << name;
            }
            for (std::string name; no >> name;) {
                EXPECT_FALSE(events_.isEventInUse(name)) << patterns << " " << name;
            }
        }
    }
    directory_.write("preferences/d.json", R"({"k": 1})"); // no news of this file
    EXPECT_EQ(valueAfterChange(), 1);
    EXPECT_TRUE(events_.isEventInUse("1x"));
    EXPECT_THAT(log_.take(), ElementsAre(HasSubstr("analytics.json: events_in_use is no array"),
                                         HasSubstr("analytics.json: events_in_use holds what is no name")));
    for (int number = 0; number < 10'000; ++number) { // more than are remembered
        ASSERT_FALSE(events_.isEventInUse("com.vandra.tamblo.event." + std::to_string(number)));
    }
    EXPECT_TRUE(events_.isEventInUse("1x"));
}

TEST_F(LinuxAnalyticsEventServiceTest, WritesTheEventsThatAreInUse) {
    useEvents(R"(["e1", "e\"2"])");
    int calls = 0;
    Dictionary payload{{"k", 1}, {"t", "x\ny"}};
    const auto provider = [&] {
        ++calls;
        return payload;
    };
    events_.sendEventLazy("e1", provider);
    events_.sendEventLazy("e3", provider);
    events_.sendEventLazy("e\"2", provider);
    payload.set("k", 2); // the same dictionary, another payload
    events_.sendEventLazy("e1", provider);
    EXPECT_EQ(calls, 3);
    EXPECT_EQ(directory_.read("analytics-events.jsonl"), "");
    events_.flush();
    events_.sendEventLazy("e1", [] { return Dictionary(); });
    events_.flush();
    EXPECT_EQ(directory_.read("analytics-events.jsonl"),
              R"({"time":0.25,"event":"e1","payload":{"k":1,"t":"x\ny"}})"
              "\n"
              R"({"time":0.25,"event":"e\"2","payload":{"k":1,"t":"x\ny"}})"
              "\n"
              R"({"time":0.5,"event":"e1","payload":{"k":2,"t":"x\ny"}})"
              "\n"
              R"({"time":0.75,"event":"e1","payload":{}})"
              "\n");
}

TEST(LogFilterTest, ReadsLevelsForAllAndForSingleCategories) {
    const struct {
        const char* words;
        LogLevel zrrs, zrrc;
        std::vector<std::string> unknown;
    } cases[] = {
        {"", LogLevel::standard, LogLevel::standard, {}},
        {"error,zrrs=debug", LogLevel::debug, LogLevel::error, {}},
        {" zrrs = info , fault ,, zrrs=default", LogLevel::standard, LogLevel::fault, {}},
        {"loud,zrrs=,zrrc=Debug,zr=info,info,=error",
         LogLevel::info,
         LogLevel::info,
         {"loud", "zrrs=", "zrrc=Debug", "zr=info", "=error"}},
    };
    for (const auto& [words, zrrs, zrrc, unknown] : cases) {
        const LogFilter filter(words);
        EXPECT_EQ(filter.threshold("zrrs"), zrrs) << words;
        EXPECT_EQ(filter.threshold("zrrc"), zrrc) << words;
        EXPECT_EQ(filter.unknownWords(), unknown) << words;
    }
}

/// The end of a pipe or socket that takes the log in.
class LogReader {
public:
    explicit LogReader(bool isSocket) {
        int ends[2];
        EXPECT_EQ(isSocket ? ::socketpair(AF_UNIX, SOCK_STREAM, 0, ends) : ::pipe(ends), 0);
        in_ = FileDescriptor(ends[0]);
        out_ = FileDescriptor(ends[1]);
        ::fcntl(in_.get(), F_SETFL, O_NONBLOCK);
    }
    [[nodiscard]] int writeEnd() const { return out_.get(); }
    void close() { in_.reset(); }
    std::string take() {
        std::string text;
        std::array<char, 4096> bytes;
        for (ssize_t count = 0; (count = ::read(in_.get(), bytes.data(), bytes.size())) > 0;) {
            text.append(bytes.data(), static_cast<std::size_t>(count));
        }
        return text;
    }

private:
    FileDescriptor in_, out_;
};

TEST(LinuxStructuredLogTest, WritesHarmlessLinesOfBoundedLength) {
    LogReader reader(false);
    LinuxStructuredLog log(reader.writeEnd(), "bogus");
    EXPECT_THAT(reader.take(), testing::MatchesRegex(
                                   "<3>zrrs        LinuxStructuredLog:[0-9 ]{5} TAMBLO_LOG: \"bogus\".*\n"));
    LinuxStructuredLog(reader.writeEnd(), "debug,zrrs=fault").report(LogLevel::error, "zrrs", "off");
    EXPECT_EQ(reader.take(), "");
    log.write(LogLevel::fault, "zrrc", "a\n<3>zrrs forged\r\t\x1b[2J\x7f \xC2\x9B é \\");
    log.write(LogLevel::debug, "zrrr", "");
    EXPECT_EQ(reader.take(), "<2>zrrc a\\n<3>zrrs forged\\r\\t\\x1b[2J\\x7f \\x9b é \\\n<7>zrrr \n");
    for (std::size_t length = 8170; length < 8190; ++length) {
        log.write(LogLevel::standard, "zrrr", std::string(length, 'x') + "€uro");
        const std::string line = reader.take();
        EXPECT_LE(line.size(), LinuxStructuredLog::kMaximumLine);
        EXPECT_THAT(line, testing::AnyOf(testing::EndsWith("x…\n"), testing::EndsWith("€…\n"),
                                         testing::EndsWith("€uro\n"), testing::EndsWith("€u…\n"),
                                         testing::EndsWith("€ur…\n")));
    }
}

TEST(LinuxStructuredLogTest, NeitherWaitsForAReaderNorEndsWithIt) {
    for (const bool isSocket : {false, true}) {
        LogReader reader(isSocket);
        LinuxStructuredLog log(reader.writeEnd(), "");
        EXPECT_EQ(::fcntl(reader.writeEnd(), F_GETFL) & O_NONBLOCK, 0) << "others share that description";
        const std::string filling(5000, 'x');
        for (int line = 0; line < 200; ++line) { // more than a pipe or a socket holds
            log.write(LogLevel::info, "zrrs", filling);
        }
        std::size_t whole = 0;
        std::string text = reader.take();
        std::istringstream lines(text);
        for (std::string line; std::getline(lines, line);) {
            whole += line == "<6>zrrs " + filling && !lines.eof() ? 1 : 0;
        }
        EXPECT_LT(whole, 200U);
        log.write(LogLevel::info, "zrrs", "again");
        text += reader.take();
        EXPECT_THAT(text.substr(text.find("\n<3>") + 1),
                    testing::MatchesRegex("<3>zrrs        LinuxStructuredLog:[0-9 ]{5} " +
                                          std::to_string(200 - whole) +
                                          " log lines were dropped here\n<6>zrrs again\n"));
        reader.close();
        log.write(LogLevel::info, "zrrs", "to nobody");
    }
}

TEST(LinuxTracePointsTest, WritesTheCodeToTheFirstMarkerThereIs) {
    const TemporaryDirectory directory;
    directory.write("marker", "");
    const std::string missing = directory.path("missing"), marker = directory.path("marker");
    const char* const files[] = {missing.c_str(), marker.c_str()};
    LinuxTracePoints(files).EmitTracePoint(0x21044838);
    EXPECT_EQ(directory.read("marker"), "tamblo 0x21044838\n");
    LinuxTracePoints(std::span(files).first(1)).EmitTracePoint(1);
}

TEST(LinuxProcessInformationTest, NamesLivingProcessesInUtf8) {
    const LinuxProcessInformation information;
    std::string comm;
    std::getline(std::ifstream("/proc/self/comm"), comm);
    EXPECT_EQ(information.ProcessNameForPid(::getpid()), comm);
    EXPECT_EQ(information.ProcessNameForPid(0), std::nullopt);
    EXPECT_EQ(information.ProcessNameForPid(0x7FFFFFFF), std::nullopt);
    std::ofstream("/proc/self/comm") << "0123456789abc\u20AC";
    EXPECT_EQ(information.ProcessNameForPid(::getpid()), "0123456789abc");
    std::ofstream("/proc/self/comm") << "a\xFF"
                                        "b\xC3";
    EXPECT_EQ(information.ProcessNameForPid(::getpid()), "a?b?");
    std::ofstream("/proc/self/comm") << comm;
}

} // namespace
} // namespace tamblo
