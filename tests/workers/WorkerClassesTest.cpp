#include "session/WorkerClass.h"
#include "tests/workers/WorkerTest.h"

namespace tamblo {
namespace {

constexpr const char* kDomain = "com.vandra.tamblo.zrreporting";

/// Without "ZRReportingSession", and without "Worker" at the end.
std::string shortName(const WorkerClass& row) {
    return std::string(row.name.substr(18, row.name.size() - 18 - 6));
}

TEST(WorkerClassListTest, SeventeenRowsInOrderWithTheirAnswers) {
    std::vector<std::string> rows;
    for (const WorkerClass& row : workerClassList()) {
        rows.push_back(shortName(row) + (row.role.producer ? " P" : "") + (row.role.consumer ? " C" : "") +
                       (row.startOnInit ? " I" : "") + (row.handleSingleMessageSession ? " S" : ""));
    }
    EXPECT_THAT(rows, ElementsAre("Trace", "VolumeMessages P", "KaleenMessages P", "Summary P C",
                                  "InputMessages P", "Eventry C I S", "Joulery C I S", "MemoryLog C I",
                                  "QMX C I S", "DriverSnapshot P", "SystemMonitor P", "Zeph C S", "DP C",
                                  "SummaryJsonFile", "AudioRegistration C", "Rtc C S", "Quillet C S"));
}

using WorkerClassesTest = WorkerTest;

TEST_F(WorkerClassesTest, RefuseSessionsOnBuildsAndDevicesThatDoNotWantThem) {
    const struct {
        bool isInternal;
        bool areCapturesWanted;
        AudioServiceType type;
        const char* refusing;
    } cases[] = {
        {false, true, 12, "Trace Zeph DP SummaryJsonFile Quillet "},
        {false, true, AudioServiceTypeTest, "Trace Zeph DP Rtc Quillet "},
        {true, false, 65535, "DP Quillet "},
        {true, true, AudioServiceTypeTest, "Rtc "},
    };
    for (const auto& c : cases) {
        setInternalBuild(c.isInternal);
        device.preferences.set("enable_stackburst", kDomain, c.areCapturesWanted);
        device.preferences.remove("TalvixInvalidXyBackOffSeconds", kDomain);
        if (c.areCapturesWanted) {
            device.preferences.set("TalvixInvalidXyBackOffSeconds", kDomain, 1);
        }
        std::string refusing;
        for (const WorkerClass& row : workerClassList()) {
            const auto worker = row.initWithSession(device.context(), makeSession(c.type));
            refusing += worker == nullptr ? shortName(row) + " " : "";
        }
        EXPECT_EQ(refusing, c.refusing);
    }
}

} // namespace
} // namespace tamblo
