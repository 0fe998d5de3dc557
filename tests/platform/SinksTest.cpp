#include "platform/linux/sinks/LinuxAnalyticsEventService.h"
#include "platform/linux/sinks/LinuxReportFiles.h"
#include "tests/fakes/FakeWorkQueues.h"
#include "tests/platform/FaultyOperations.h"
#include "tests/platform/LinuxServiceSupport.h"

#include <gmock/gmock.h>

#include <sys/stat.h>

namespace tamblo {
namespace {

namespace fs = std::filesystem;
using testing::ElementsAre;
using testing::HasSubstr;

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

class LinuxAnalyticsEventServiceTest : public testing::Test {
protected:
    LinuxAnalyticsEventServiceTest() { fs::create_directory(path_); }

    void write(const std::string& domain, const std::string& content) {
        directory_.write("preferences/" + domain + ".json", content);
        readChanges();
    }
    /// Those that must have come.
    void readChanges() {
        const std::uint64_t before = preferences_.generation();
        while (isReadable(preferences_.fileDescriptor(), preferences_.generation() == before ? 2000 : 0)) {
            preferences_.readChanges();
        }
        EXPECT_NE(preferences_.generation(), before);
    }
    void useEvents(const std::string& patterns) {
        write("com.vandra.tamblo.analytics", R"({"events_in_use":)" + patterns + "}");
    }

    TemporaryDirectory directory_;
    const std::string path_ = directory_.path("preferences");
    RecordingLog log_;
    FakeWorkQueues queues_;
    LinuxPreferences preferences_{path_, queues_, log_};
    SteppingClock clock_;
    SinkFiles sinks_{directory_.path(), log_};
    LinuxAnalyticsEventService events_{sinks_, clock_, preferences_, log_};
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
        for (const auto& [names, isInUse] : {std::pair(inUse, true), {notInUse, false}}) {
            std::istringstream words(names);
            for (std::string name; words >> name;) {
                EXPECT_EQ(events_.isEventInUse(name), isInUse) << patterns << " " << name;
            }
        }
    }
    write("d", R"({"k": 1})"); // no news of this file
    EXPECT_TRUE(events_.isEventInUse("1x"));
    EXPECT_THAT(log_.take(), ElementsAre(HasSubstr("analytics.json: events_in_use is no array"),
                                         HasSubstr("analytics.json: events_in_use holds what is no name")));
    fs::remove(directory_.path("preferences/com.vandra.tamblo.analytics.json"));
    readChanges();
    EXPECT_TRUE(events_.isEventInUse("a.b"));
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
    sinks_.flush();
    events_.sendEventLazy("e1", provider); // another message, though with the payload of the last
    events_.sendEventLazy("e1", [] { return Dictionary(); });
    sinks_.flush();
    EXPECT_EQ(directory_.read("analytics-events.jsonl"),
              R"({"time":0.25,"event":"e1","payload":{"k":1,"t":"x\ny"}})"
              "\n"
              R"({"time":0.25,"event":"e\"2","payload":{"k":1,"t":"x\ny"}})"
              "\n"
              R"({"time":0.5,"event":"e1","payload":{"k":2,"t":"x\ny"}})"
              "\n"
              R"({"time":0.75,"event":"e1","payload":{"k":2,"t":"x\ny"}})"
              "\n"
              R"({"time":1.0,"event":"e1","payload":{}})"
              "\n");
}

class LinuxReportFilesTest : public testing::Test {
protected:
    /// The file's name, or why there is none.
    std::string create(const std::string& name) {
        auto created = files.createFile(directory.path(name));
        if (auto* const refusal = std::get_if<std::string>(&created)) {
            return *refusal;
        }
        file = std::get<std::unique_ptr<ReportFile>>(std::move(created));
        return name;
    }
    [[nodiscard]] static unsigned modeOf(const std::string& path) {
        return static_cast<unsigned>(fs::status(path).permissions());
    }

    TemporaryDirectory directory;
    FaultyOperations operations;
    LinuxReportFiles files{directory.path(), operations};
    std::unique_ptr<ReportFile> file;
};

TEST_F(LinuxReportFilesTest, DirectoriesAreForEverybodyWhateverTheMask) {
    const std::string reporting = files.reportingLogsDirectory();
    EXPECT_EQ(reporting, directory.path("DiagnosticLogs/Audio/Reporting"));
    const mode_t before = ::umask(0077);
    EXPECT_EQ(files.createDirectory(reporting), std::nullopt);
    ::umask(before);
    for (const char* name : {"DiagnosticLogs", "DiagnosticLogs/Audio", "DiagnosticLogs/Audio/Reporting"}) {
        EXPECT_EQ(modeOf(directory.path(name)), 0777U) << name;
    }
    EXPECT_EQ(modeOf(directory.path()), 0700U);
    ::chmod(reporting.c_str(), 0750);
    EXPECT_EQ(files.createDirectory(reporting), std::nullopt);
    EXPECT_EQ(modeOf(reporting), 0750U) << "what is there stays as it is";

    fs::remove_all(directory.path("DiagnosticLogs"));
    directory.write("DiagnosticLogs", "a file");
    EXPECT_EQ(files.createDirectory(reporting), "Not a directory");
    LinuxReportFiles nowhere(directory.path("gone"));
    EXPECT_EQ(nowhere.createDirectory(nowhere.reportingLogsDirectory()), "No such file or directory");
    EXPECT_FALSE(fs::exists(directory.path("gone"))) << "the service's own to make";
}

TEST_F(LinuxReportFilesTest, AFileTakesThePlaceOfARegularOneOnly) {
    operations.largestWrite = 7;
    operations.interruptions = 1000;
    directory.write("report", "an old and longer report, of which nothing must be left");
    ASSERT_EQ(create("report"), "report");
    EXPECT_EQ(directory.read("report"), "");
    const std::string text = "written in many pieces, most of them interrupted";
    EXPECT_EQ(file->write(text), std::nullopt);
    EXPECT_EQ(file->close(), std::nullopt);
    EXPECT_EQ(directory.read("report"), text);

    const mode_t before = ::umask(0);
    EXPECT_EQ(create("new"), "new");
    ::umask(before);
    EXPECT_EQ(modeOf(directory.path("new")), 0644U);

    fs::create_symlink(directory.path("report"), directory.path("link"));
    ::mkfifo(directory.path("pipe").c_str(), 0600);
    EXPECT_EQ(create("link"), "Too many levels of symbolic links");
    EXPECT_EQ(create("pipe"), "No such device or address");
    EXPECT_EQ(create("gone/report"), "No such file or directory");
    EXPECT_EQ(std::get<std::string>(files.createFile("/dev/full")), "not a regular file");
    EXPECT_EQ(directory.read("report"), text);
}

TEST_F(LinuxReportFilesTest, ADiskThatFillsUpIsToldAndMayEmptyAgain) {
    ASSERT_EQ(create("report"), "report");
    operations.room = 10;
    EXPECT_EQ(file->write("0123456789"), std::nullopt);
    EXPECT_EQ(file->write("lost"), "No space left on device");
    operations.room.reset();
    EXPECT_EQ(file->write(", more"), std::nullopt);
    operations.closeError = EIO;
    EXPECT_EQ(file->close(), "Input/output error");
    EXPECT_EQ(directory.read("report"), "0123456789, more");
}

} // namespace
} // namespace tamblo
