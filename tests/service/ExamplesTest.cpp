#include "tests/service/RealService.h"

#include <gmock/gmock.h>

#include <sys/stat.h>

// The examples, run as their heads say, and the configuration of examples/device.

namespace tamblo::test {
namespace {

using testing::HasSubstr;
using testing::Not;

const std::string kExamples = EXAMPLES_DIR;
const std::string kPython = "PYTHONDONTWRITEBYTECODE=1 PYTHONPATH=" + kExamples + "/python python3 ";

/// The same reporter in four languages.
class Reporter : public testing::TestWithParam<const char*> {
protected:
    [[nodiscard]] static CommandResult runIn(const std::string& runtimeDirectory) {
        return run("RUNTIME_DIRECTORY=" + runtimeDirectory +
                   " TAMBLOCTL=" TAMBLOCTL_PATH " PYTHONDONTWRITEBYTECODE=1 timeout 20 " + GetParam());
    }
};
INSTANTIATE_TEST_SUITE_P(Examples, Reporter,
                         testing::Values(REPORTERS_DIR "/reporter_c", REPORTERS_DIR "/reporter_cpp",
                                         EXAMPLES_DIR "/python/reporter", EXAMPLES_DIR "/shell/reporter"));

TEST_P(Reporter, ReportsASessionWhoseSummaryReachesTheSink) {
    const ServiceProcess service;
    const CommandResult done = runIn(service.runtimeDirectory());
    EXPECT_EQ(done.status, 0) << done.output;
    const std::string lines = contentOf(service.logs() / "analytics-events.jsonl");
    for (const char* const part :
         {"\"event\":\"com.vandra.longformaudio.Session_Playback.Start\"",
          "\"options\":[\"AllowBluetooth\",\"AllowAirPlay\"]", "\"QVSessionVolume\":0.75",
          "\"session_duration\":12.5", "\"event\":\"com.vandra.longformaudio.Volume.Summary\""}) {
        EXPECT_THAT(lines, HasSubstr(part));
    }
    EXPECT_THAT(service.errorOutput(), Not(HasSubstr("<3>")));
}

TEST_P(Reporter, SaysSoAndEndsWithoutAService) {
    const TemporaryDirectory empty;
    const CommandResult done = runIn(empty.path("run"));
    EXPECT_TRUE(done.status != 0 && done.status != 124 && !done.output.empty()) << done.status << done.output;
}

TEST(PythonModule, SendsEveryKindOfValueAndRaisesWhatIsRefused) {
    const ServiceProcess service;
    const TemporaryDirectory directory;
    writeFile(directory.path("script.py"), R"(
import datetime, tamblo
day = datetime.datetime(2026, 11, 1, 12, 30, tzinfo=datetime.timezone.utc)
with tamblo.Client() as client:
    client.send("Volume", "Generic", {
        "true": True, "negative": -5, "lowest": -2**63, "highest": 2**64 - 1, "double": 0.1, "day": day,
        "single": tamblo.Single(0.1), "bytes": b"\x01\x02", "array": [1, (False, "ä" * 300)],
        "map": {"inner": 70000}})
    with client.session(-7) as session:
        assert client.reporters() == [-7]
    assert client.reporters() == []
    for wrong in ({"none": None}, {"too low": -2**63 - 1}, {1: 2}, {"what": object()}):
        try:
            client.send("Volume", "Generic", wrong)
            raise SystemExit(f"sent {wrong}")
        except (tamblo.ServiceError, OverflowError, TypeError) as error:
            print(error)
    try:
        client.call("fly")
    except tamblo.ServiceError as error:
        print(error.code)
    try:
        with client.session(5, configuration={"none": None}):
            raise SystemExit("started without its configuration")
    except tamblo.ServiceError:
        assert client.reporters() == []
    try:
        client.send("Volume", "Generic", {"long": "x" * 2**21})
    except tamblo.ServiceError as error:
        print(error)
)");
    const CommandResult done =
        run("RUNTIME_DIRECTORY=" + service.runtimeDirectory() + " " + kPython + directory.path("script.py"));
    EXPECT_EQ(done.status, 0) << done.output;
    EXPECT_THAT(done.output, HasSubstr("null or undefined is no value here"));
    EXPECT_THAT(done.output, HasSubstr("-32601"));
    EXPECT_THAT(done.output, HasSubstr("longer than 1 MiB"));
    std::string longText;
    for (int i = 0; i < 300; ++i) {
        longText += "ä";
    }
    const std::string lines = contentOf(service.logs() / "analytics-events.jsonl");
    EXPECT_THAT(lines, HasSubstr("\"array\":[1,[false,\"" + longText + "\"]]"));
    EXPECT_THAT(lines, HasSubstr(R"("bytes":"AQI=","day":"2026-11-01T12:30:00.000Z","double":0.1,)"
                                 R"("highest":18446744073709551615,)"));
    EXPECT_THAT(lines, HasSubstr(R"("lowest":-9223372036854775808,"map":{"inner":70000},"negative":-5,)"
                                 R"("single":0.1,"true":true,)"));
}

TEST(DeviceConfiguration, IsTakenAsItStands) {
    ServiceProcess::Options options;
    for (const auto& entry : std::filesystem::directory_iterator(kExamples + "/device/preferences")) {
        options.preferences.emplace_back(entry.path().stem(), contentOf(entry.path()));
    }
    ASSERT_GE(options.preferences.size(), 4U);
    const ServiceProcess service(std::move(options));
    Session client(service.socketPath(), 7, 7);
    client.call(message({{"n", 1}}));
    EXPECT_EQ(service.countEvents("com.vandra.longformaudio.Playback.Start"), 1U);
    EXPECT_EQ(service.countEvents("com.vandra.tamblo.Playback.Start"), 0U);
    EXPECT_EQ(service.countEvents("Example Speaker 3"), 1U);

    struct stat file {};
    ASSERT_EQ(::stat((service.logs() / "analytics-events.jsonl").c_str(), &file), 0);
    EXPECT_EQ(file.st_mode & 0777U, 0640U);
    EXPECT_THAT(service.errorOutput(), Not(HasSubstr("<3>")));

    std::int64_t sessions = 1;
    while (sessions < 1000 && !client.call(request(Method::createReportingSession, 1000 + sessions))->error) {
        ++sessions;
    }
    EXPECT_EQ(sessions, 256);
}

} // namespace
} // namespace tamblo::test
