#include "tools/SessionFile.h"
#include "base/Format.h"
#include "tests/Files.h"
#include "tools/SessionRecorder.h"

#include <filesystem>

#include <gmock/gmock.h>

namespace tamblo::tools {
namespace {

using testing::ElementsAre;
using testing::HasSubstr;

std::string openLine(const std::string& name, int reporter, const std::string& application, double time) {
    return formatted(R"({"time":{},"op":"open","session":"{}","sessionInfo":{"SessionID":{}},)"
                     R"("userInfo":{"ClientName":"com.vandra.tamblo","HostApplicationDisplayID":"{}",)"
                     R"("ServiceName":"telephony_session","ZRReportingSessionID":{}}})",
                     time, name, reporter, application, reporter) +
           "\n";
}

std::string messageLine(const std::string& name, double time, const std::string& rest) {
    return formatted(R"({"time":{},"op":"message","session":"{}",{}})", time, name, rest) + "\n";
}

struct Recorded {
    RecordingReport report;
    std::string leftOut;
    std::vector<std::string> lines;
};

Recorded record(const TemporaryDirectory& directory, SinkSnapshot& sink, const FoundSession& session) {
    const std::string path = directory.path("recording");
    std::FILE* const file = std::fopen(path.c_str(), "we");
    SessionFileWriter writer(file);
    const RecordingReport report = recordSession(sink, session, writer);
    static_cast<void>(std::fclose(file));
    return {report, writer.leftOut(), test::linesOf(path)};
}

TEST(SessionRecorder, TakesOneSessionOutOfHostileFilesThatAreRenamedMeanwhile) {
    const TemporaryDirectory directory;
    const std::string path = directory.path("call-quality.jsonl");
    const std::string tagged = R"("category":4,"type":1,"payload":{"audiotag":"Session_PlaybackStart","n":)";
    test::writeFile(path + ".1",
                    openLine("a.1", 7, "app", 100) + std::string(40U << 20U, 'x') + "\n" +
                        messageLine("a.1", 101, tagged + "1}") + openLine("a.2", 8, "other", 101) +
                        messageLine("a.2", 102, tagged + "9}") +
                        messageLine("a.1", 102.5, R"("category":4,"type":1,"payload":[1])") +
                        messageLine("a.1", 103, R"("category":12,"type":16,"payload":{"reads":1})"));
    // A text that looks like an end, a clock that was set back, a value that JSON has not, an unknown type.
    test::writeFile(
        path, messageLine("a.3", 50, R"("category":4,"type":1,"payload":{"\"session\":\"a.1\"":1})") +
                  messageLine("a.1", 90, tagged + R"("\"op\":\"flush\"","f":null})") +
                  messageLine("a.1", 104, R"("category":99,"type":77,"payload":{})") +
                  "{\"session\":\"a.1\", torn\n" + messageLine("a.1", 105, tagged + "3}").substr(0, 50));
    SinkSnapshot sink(path);
    std::filesystem::rename(path + ".1", path + ".2");
    std::filesystem::remove(path);

    const auto found = findSession(sink, {.reporterID = 7});
    ASSERT_TRUE(found);
    const Recorded all = record(directory, sink, *found);
    EXPECT_THAT(
        all.lines,
        ElementsAre(
            R"({"session":{"configuration":{"HostApplicationDisplayID":"app"},"name":"a.1","reporter":7,"service_type":"telephony","time":100.0}})",
            R"({"offset_s":1.0,"category":"Session_Playback","type":"Start","payload":{"n":1}})",
            R"({"offset_s":1.0,"category":"Session_Playback","type":"Start","payload":{"n":"\"op\":\"flush\""}})",
            R"({"offset_s":4.0,"category":99,"type":77,"payload":{}})"));
    EXPECT_EQ(all.report.unreadable, 2U);
    EXPECT_EQ(all.report.withoutNull, 1U);
    EXPECT_EQ(all.report.passedOver, 2U) << "one too long, one torn";
    EXPECT_FALSE(all.report.hasStopped);
    EXPECT_THAT(all.leftOut, HasSubstr("1 left out as playing makes them anew (driver statistics)"));
    EXPECT_THAT(all.leftOut, HasSubstr("1 moved"));

    EXPECT_EQ(findSession(sink, {})->name, "a.2") << "the last";
    EXPECT_EQ(findSession(sink, {.application = "app"})->name, "a.1");
    EXPECT_FALSE(findSession(sink, {.reporterID = 8, .application = "app"}));
    const auto headless = findSession(sink, {.name = "a.3"});
    ASSERT_TRUE(headless && !headless->hasOpenLine);
    EXPECT_EQ(record(directory, sink, *headless).lines.size(), 1U);
}

TEST(SessionFile, HeadersAreToldFromMessagesAndWrongOnesRefused) {
    const auto header = parseSessionHeader(
        R"({"session": {"service_type": "haptics", "configuration": {"a": 1}, "more": 1}})");
    const auto& read = std::get<std::optional<SessionHeader>>(header);
    ASSERT_TRUE(read && read->configuration);
    EXPECT_EQ(read->serviceType, client::ServiceType::haptics);
    EXPECT_TRUE(read->configuration->contains("a"));
    for (const std::string_view wrong : {R"({"session": 5})", R"({"session": {"service_type": "nope"}})",
                                         R"({"session": {"configuration": []}})"}) {
        EXPECT_TRUE(std::holds_alternative<std::string>(parseSessionHeader(wrong))) << wrong;
    }
    for (const std::string_view other : {R"({"category": 4, "session": 5})", "{}", "{"}) {
        const auto none = parseSessionHeader(other);
        EXPECT_FALSE(std::get<std::optional<SessionHeader>>(none)) << other;
    }
}

} // namespace
} // namespace tamblo::tools
