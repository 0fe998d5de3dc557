#include "tools/report/Report.h"
#include "tests/Files.h"

#include <gmock/gmock.h>
#include <nlohmann/json.hpp>

#include <future>
#include <map>

#include <sys/stat.h>

// Pages are made of files that are written here, and their data held against what was written.

namespace tamblo::report {
namespace {

using nlohmann::json;
using testing::Contains;
using testing::ElementsAre;
using testing::EndsWith;
using testing::HasSubstr;
using testing::IsEmpty;
using testing::StartsWith;

constexpr double kBegin = 1795266488;

class ReportTest : public testing::Test {
protected:
    void callQuality(double time, const std::string& op, const std::string& session, const json& rest) {
        json line{{"time", time}, {"op", op}, {"session", session}};
        line.update(rest);
        write("call-quality.jsonl", line.dump());
    }
    void message(double time, const std::string& session, json payload) {
        payload["HostApplicationDisplayID"] = "com.example.music";
        callQuality(time, "message", session, {{"category", 4}, {"type", 1}, {"payload", payload}});
    }
    /// As the service writes it, under both names.
    void event(double time, const std::string& type, const std::string& event, const json& payload) {
        for (const std::string& of : {std::string("tamblo"), type}) {
            write("analytics-events.jsonl", "{\"time\":" + json(time).dump() + ",\"event\":\"com.vandra." +
                                                of + "." + event + "\",\"payload\":" + payload.dump() + "}");
        }
    }
    void write(const std::string& sink, const std::string& line) {
        test::writeFile(logs_.path(sink), line + "\n", std::ios::app | std::ios::binary);
    }
    /// The data in the page.
    json made() {
        plan_.directory = logs_.path();
        plan_.page = logs_.path("report.html");
        plan_.now = kBegin + 1e6;
        const auto result = makeReport(plan_);
        EXPECT_TRUE(std::holds_alternative<ReportResult>(result)) << std::get<std::string>(result);
        page_ = logs_.read("report.html");
        const std::string mark = R"(<script type="application/json" id="data">)";
        const std::size_t begin = page_.find(mark) + mark.size();
        return json::parse(page_.substr(begin, page_.find("</script>", begin) - begin));
    }

    enum Field {
        name,
        application,
        service,
        process,
        reporter,
        began,
        ended,
        flags,
        messages,
        stretches,
        marks,
        summaries
    };
    static std::string text(const json& data, const json& number) {
        return data["texts"][number.get<std::size_t>()];
    }

    TemporaryDirectory logs_;
    ReportPlan plan_;
    std::string page_;
};

TEST_F(ReportTest, SessionsAreThoseOfTheCallQualityFileAtTheTimesOfTheEvents) {
    std::map<std::string, double> seconds;
    for (int i = 0; i < 40; ++i) {
        const double at = kBegin + i * 100;
        const std::string id = "p." + std::to_string(i),
                          route = i % 3 == 0 ? "Receiver, Microphone" : "Speaker";
        callQuality(at, "open", id,
                    {{"userInfo",
                      {{"HostApplicationDisplayID", "com.example.music"},
                       {"ServiceName", "telephony_session"},
                       {"ZRReportingSessionID", i}}}});
        const json starts{{"audiotag", "PlaybackStart"},
                          {"session_output_running", true},
                          {"active_devices", route},
                          {"QVSessionVolume", 0.5}};
        message(at + 1, id, starts);
        message(at + 2, id, {{"audiotag", "IOError"}, {"issue_type", "overload"}});
        message(at + 3, id, {{"audiotag", "VolumeGeneric"}, {"QVSessionVolume", 0.5}});
        message(at + 9, id, {{"audiotag", "PlaybackStop"}, {"session_output_running", false}});
        const json summary{{"audiotag", "VolumeSummary"},
                           {"play_seconds", 8.5},
                           {"active_devices", route},
                           {"QVSessionVolumeBucketed", "0.5"}};
        message(at + 10, id, summary);
        callQuality(at + 11, "flush", id, json::object());
        // It happened half a second before it was reported, which only the event tells.
        json stamped(starts);
        stamped["HostApplicationDisplayID"] = "com.example.music";
        stamped["zrreporting_timestamp"] = at + 0.5;
        event(at + 1, "telephony", "Playback.Start", stamped);
        seconds[route] += 8.5;
    }
    const json data = made();
    ASSERT_EQ(data["sessions"].size(), 40);
    std::map<std::string, double> shown;
    for (std::size_t i = 0; i < 40; ++i) {
        const json& session = data["sessions"][i];
        const auto at = static_cast<std::int64_t>(i) * 100'000;
        EXPECT_EQ(text(data, session[name]), "p." + std::to_string(i));
        EXPECT_EQ(text(data, session[service]), "telephony");
        EXPECT_EQ(session[reporter], i);
        EXPECT_EQ(session[began], at);
        EXPECT_EQ(session[ended], at + 11'000);
        EXPECT_EQ(session[messages], 4);
        EXPECT_EQ(session[stretches], json({{at + 500, at + 9000, 1, 0}}));
        std::vector<std::string> marked;
        for (const json& mark : session[marks]) {
            marked.push_back(json({mark[0].get<std::int64_t>() - at, mark[1], text(data, mark[2])}).dump());
        }
        const std::string route = i % 3 == 0 ? "Receiver, Microphone" : "Speaker";
        EXPECT_THAT(marked,
                    ElementsAre("[500,1,\"" + route + "\"]", R"([500,0,"0.5"])", R"([2000,2,"overload"])"));
        for (const json& summary : session[summaries]) {
            shown[summary[4]] += summary[1].get<double>();
        }
    }
    EXPECT_EQ(shown, seconds);
    EXPECT_THAT(data["leftOut"], IsEmpty());
}

TEST_F(ReportTest, EventsAloneMakeSessionsFromStopToStop) {
    const auto send = [this](double at, const std::string& what, json payload) {
        payload["HostApplicationDisplayID"] = "com.example.phone";
        payload["audiotag"] = what == "Volume.Summary"            ? "VolumeSummary"
                              : what == "Input.Summary"           ? "InputSummary"
                              : what == "Session_Generic.Summary" ? "Session_GenericSummary"
                                                                  : "PlaybackStart";
        event(at, "telephony", what, payload);
    };
    for (const double at : {kBegin, kBegin + 100}) {
        send(at, "Playback.Start", {{"session_input_running", true}});
        send(at + 40, "Playback.Start", {{"session_duration", 40.0}});
        send(at + 50, "Volume.Summary", {{"play_seconds", 20}});
        send(at + 50, "Volume.Summary", {{"play_seconds", 10}});
        send(at + 51, "Session_Generic.Summary",
             {{"summaryServiceName", "telephony"}, {"clientProcessName", "phone"}});
        send(at + 51, "Input.Summary", {{"inputrunning_seconds", 40}});
    }
    plan_.wanted.application = "com.example.*";
    json data = made();
    ASSERT_EQ(data["sessions"].size(), 2);
    const json& second = data["sessions"][1];
    EXPECT_EQ(text(data, second[process]), "phone");
    EXPECT_EQ(second[messages], 2);
    EXPECT_EQ(second[summaries].size(), 4);
    // Input as its messages say; output, of which there are only summaries, in front of the stop.
    EXPECT_EQ(second[stretches],
              json({{100'000, 140'000, 0, 0}, {141'000, 151'000, 1, 2}, {121'000, 141'000, 1, 2}}));
    plan_.wanted.since = kBegin + 60;
    EXPECT_EQ(made()["sessions"].size(), 1);
    plan_.wanted.application = "com.example.music";
    EXPECT_THAT(made()["sessions"], IsEmpty());
}

TEST_F(ReportTest, WhatClientsNameIsNeverMarkup) {
    const std::vector<std::string> names{"</script><script>alert(1)</script>", "<!-- <script>",
                                         "{{nonce}}\u2028\u2029&amp;", "\"'\\</ScRiPt >",
                                         "<img src=x onerror=alert(1)>"};
    double at = kBegin;
    for (const std::string& hostile : names) {
        callQuality(++at, "open", hostile,
                    {{"userInfo", {{"HostApplicationDisplayID", hostile}, {"ServiceName", hostile}}}});
        message(++at, hostile,
                {{"audiotag", hostile}, {"issue_type", hostile}, {hostile, 1}, {"active_devices", hostile}});
    }
    write("bug-captures.jsonl",
          json({{"time", at}, {"op", "end"}, {"session", "../../<b>"}, {"signature", {{"type", names[0]}}}})
              .dump());
    const json data = made();
    for (std::size_t i = 0; i < names.size(); ++i) {
        EXPECT_EQ(text(data, data["sessions"][i][application]), names[i]);
        EXPECT_EQ(text(data, data["sessions"][i][marks][1][2]), names[i]);
    }
    EXPECT_EQ(data["device"].size(), 1);
    std::size_t tags = 0;
    for (std::size_t tag = page_.find("<script"); tag != std::string::npos;
         tag = page_.find("<script", tag + 1)) {
        ++tags;
    }
    EXPECT_EQ(tags, 2) << "the data and the page's own";
    EXPECT_THAT(page_, Not(HasSubstr("<img")));
    EXPECT_THAT(page_, Not(HasSubstr("\u2028")));
    EXPECT_THAT(page_,
                HasSubstr("Content-Security-Policy\" content=\"default-src 'none'; script-src 'nonce-"));
}

TEST_F(ReportTest, LinesThatAreNotUnderstoodAreLeftOutAndCounted) {
    callQuality(kBegin, "open", "p.1", json::object());
    for (const std::string odd : {R"({"time":1,"op":"open")", "\xFF", "[]", "{}", "", "null"}) {
        write("call-quality.jsonl", odd);
    }
    callQuality(kBegin + 1, "somersault", "p.1", json::object());
    callQuality(kBegin + 1, "message", "p.1",
                {{"payload", {{"active_devices", {1, {2}}}, {"zrreporting_timestamp", -5e300}}}});
    callQuality(1e300, "flush", "p.1", json::object());
    write("call-quality.jsonl", "{\"time\":1,\"op\":\"" + std::string(2 << 20, 'x') + "\"}");
    test::writeFile(logs_.path("call-quality.jsonl"), R"({"time":5,"op":)", std::ios::app);
    std::filesystem::create_directory(logs_.path("stack-captures.jsonl"));
    const json data = made();
    EXPECT_THAT(data["sessions"], testing::SizeIs(1));
    EXPECT_EQ(text(data, data["sessions"][0][marks][0][2]), "[…]");
    EXPECT_EQ(data["sessions"][0][marks][0][0], 1000) << "at the time of its line";
    EXPECT_THAT(data["leftOut"].get<std::vector<std::string>>(),
                ElementsAre(StartsWith("1 lines without an end"), StartsWith("1 lines of more than 1 MiB"),
                            StartsWith("5 lines that are no JSON object"),
                            StartsWith("3 lines that are not understood"),
                            "stack-captures.jsonl, which cannot be read"));
}

TEST_F(ReportTest, AClockThatIsSetBackMakesNegativeLengths) {
    callQuality(kBegin, "open", "p.1", json::object());
    message(kBegin + 1, "p.1", {{"audiotag", "x"}, {"session_output_running", true}});
    message(kBegin - 3600, "p.1", {{"audiotag", "x"}, {"session_output_running", false}});
    callQuality(kBegin - 3599, "flush", "p.1", json::object());
    const json session = made()["sessions"][0];
    EXPECT_EQ(session[ended].get<std::int64_t>() - session[began].get<std::int64_t>(), -3'599'000);
    EXPECT_EQ(session[flags].get<int>() & 4, 4);
    EXPECT_EQ(session[stretches][0][1].get<std::int64_t>() - session[stretches][0][0].get<std::int64_t>(),
              -3'601'000);
}

TEST_F(ReportTest, TheNewestIsKeptWithinTheMemoryThatItMayTake) {
    for (int i = 0; i < 400; ++i) {
        const std::string id = "p." + std::to_string(i);
        callQuality(kBegin + i, "open", id, json::object());
        message(kBegin + i + 0.5, id, {{"audiotag", "x"}, {"active_devices", std::string(1000, 'a') + id}});
        callQuality(kBegin + i + 0.7, "flush", id, json::object());
        event(kBegin + i + 0.5, "telephony", "x.y",
              {{"HostApplicationDisplayID", "com.example.music"}, {"audiotag", "x"}});
    }
    std::filesystem::rename(logs_.path("call-quality.jsonl"), logs_.path("call-quality.jsonl.2"));
    plan_.mostBytes = 100'000;
    const json data = made();
    const std::size_t kept = data["sessions"].size();
    EXPECT_GT(kept, 20U);
    EXPECT_LT(kept, 120U);
    EXPECT_EQ(text(data, data["sessions"].back()[name]), "p.399");
    EXPECT_THAT(data["leftOut"][0].get<std::string>(),
                StartsWith(std::to_string(400 - kept) + " of the oldest sessions"));
}

TEST_F(ReportTest, WhatIsNotAskedForTakesNoMemoryFromWhatIs) {
    for (int i = 0; i < 400; ++i) {
        const double at = kBegin + i;
        const std::string id = "p." + std::to_string(i),
                          host = i < 10 ? "com.example.rare" : "com.example.often";
        callQuality(at, "open", id,
                    {{"userInfo",
                      {{"HostApplicationDisplayID", host},
                       {"ServiceName", "telephony_session"},
                       {"ZRReportingSessionID", i}}}});
        json payload{{"HostApplicationDisplayID", host}, {"audiotag", "IOError"}};
        callQuality(at + 0.5, "message", id, {{"payload", payload}});
        event(at + 0.5, "telephony", "IO.Error", payload);
        payload["audiotag"] = "KaleenSummary"; // which is no call-quality line
        event(at + 0.6, "telephony", "Kaleen.Summary", payload);
        payload["audiotag"] = "Session_GenericSummary";
        callQuality(at + 0.7, "message", id, {{"payload", payload}});
        event(at + 0.7, "telephony", "Session_Generic.Summary", payload);
        if (i % 2 == 0) {
            callQuality(at + 0.8, "flush", id, json::object());
        }
    }
    plan_.mostBytes = 60'000;
    plan_.wanted.application = "com.example.rare";
    json data = made();
    EXPECT_EQ(data["sessions"].size(), 10);
    EXPECT_THAT(data["leftOut"], IsEmpty());
    plan_.wanted = {.since = {}, .session = "3", .application = {}};
    data = made();
    ASSERT_EQ(data["sessions"].size(), 1);
    EXPECT_EQ(text(data, data["sessions"][0][name]), "p.3");
    EXPECT_THAT(data["leftOut"], IsEmpty());
    plan_.mostBytes = ReportPlan::kMost;
    EXPECT_EQ(made()["sessions"][0][summaries].size(), 2) << "its own, and none of those before";
}

TEST_F(ReportTest, AFileIsReplacedWhereALinkLeadsAndAPipeIsWrittenInto) {
    callQuality(kBegin, "open", "p.1", json::object());
    plan_.directory = logs_.path();
    std::filesystem::create_symlink("page", logs_.path("link"));
    test::writeFile(logs_.path("page"), "old");
    plan_.page = logs_.path("link");
    EXPECT_TRUE(std::holds_alternative<ReportResult>(makeReport(plan_)));
    EXPECT_TRUE(std::filesystem::is_symlink(logs_.path("link")));
    EXPECT_THAT(logs_.read("page"), StartsWith("<!DOCTYPE"));
    ASSERT_EQ(::mkfifo(logs_.path("pipe").c_str(), 0600), 0);
    auto received = std::async(std::launch::async, [this] { return logs_.read("pipe"); });
    plan_.page = logs_.path("pipe");
    EXPECT_TRUE(std::holds_alternative<ReportResult>(makeReport(plan_)));
    EXPECT_THAT(received.get(), EndsWith("</html>\n"));
    EXPECT_TRUE(std::filesystem::is_fifo(logs_.path("pipe")));
}

TEST_F(ReportTest, ARunningSessionIsNotToldTwice) {
    const json overload{{"HostApplicationDisplayID", "com.example.music"},
                        {"audiotag", "IOError"},
                        {"issue_type", "overload"}};
    callQuality(kBegin, "open", "p.1", {{"userInfo", {{"HostApplicationDisplayID", "com.example.music"}}}});
    for (int i = 1; i <= 9; ++i) {
        event(kBegin + 0.1 * i, "telephony", "IO.Error", overload);
    }
    for (int i = 1; i <= 6; ++i) { // the rest waits to be written
        callQuality(kBegin + 0.1 * i, "message", "p.1", {{"payload", overload}});
    }
    EXPECT_EQ(made()["sessions"].size(), 1);
    event(kBegin + 60, "telephony", "IO.Error", overload); // of another session, as it seems
    EXPECT_EQ(made()["sessions"].size(), 2);
}

} // namespace
} // namespace tamblo::report
