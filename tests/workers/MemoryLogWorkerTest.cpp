#include "platform/ProcessList.h"
#include "session/ZRReportingSession.h"
#include "tests/base/AllocationCount.h"
#include "tests/fakes/FakePlatform.h"
#include "workers/sinks/ZRReportingSessionMemoryLogWorker.h"

#include <gmock/gmock.h>

#include <cmath>
#include <numeric>

namespace tamblo {
namespace {

using namespace std::chrono_literals;
using testing::ElementsAre;
using testing::ElementsAreArray;
using testing::SizeIs;

TEST(ProcessListTest, TakesWhatIsAProcessOnceAndUpToItsLimit) {
    const struct {
        Value named;
        std::vector<pid_t> processes;
    } cases[] = {
        {12, {1, 2, 12}},
        {Array{12, 1, 12, 13}, {1, 2, 12, 13}},
        {Array{0, -1, 0x7FFF'FFFF, 0x8000'0000, 0x1'0000'0003, ~0ULL, 1e300, std::nan("")},
         {1, 2, 0x7FFF'FFFF}},
        {Array{"12", true, Dictionary{{"a", 3}}, Array{4}, Value::date(5), 6.0}, {1, 2, 6}},
        {"12", {1, 2}},
        {Dictionary{{"a", 3}}, {1, 2}},
        {Array{}, {1, 2}},
    };
    constexpr pid_t own[] = {1, 2, 1, 0};
    for (const auto& row : cases) {
        ProcessList list;
        list.add(own);
        list.addNamedBy({{"processIDs", row.named}});
        EXPECT_THAT(std::move(list).take(), ElementsAreArray(row.processes));
    }
    for (const std::size_t count : {63U, 64U, 65U, 100'000U}) {
        Array many(count);
        std::iota(many.begin(), many.end(), 100);
        ProcessList list;
        list.addNamedBy({{"processIDs", Value(many)}});
        EXPECT_THAT(std::move(list).take(), SizeIs(std::min<std::size_t>(count, 64)));
        ProcessList larger(512);
        larger.addNamedBy({{"processIDs", Value(many)}});
        EXPECT_THAT(std::move(larger).take(), SizeIs(std::min<std::size_t>(count, 64)));
    }
}

class MemoryLogWorkerTest : public testing::Test {
protected:
    static MessageRef messageOf(AudioEventType type) {
        return std::make_shared<ZRReportingSessionMessage>(Dictionary{{"processIDs", 7}}, 4, type);
    }
    /// Whether a message of this type is recorded.
    bool records(AudioEventType type) {
        const std::size_t before = device.memoryLog.requests.size();
        worker.handleMessage(messageOf(type));
        return device.memoryLog.requests.size() != before;
    }

    FakePlatform device;
    std::shared_ptr<ZRReportingSession> session = ZRReportingSession::initWithID(5, {41});
    ZRReportingSessionMemoryLogWorker worker{session};
};

TEST_F(MemoryLogWorkerTest, ASecondPassesBetweenRecordsUnlessTheClockIsSetBack) {
    const struct {
        std::chrono::nanoseconds step;
        bool isRecorded;
    } cases[] = {{0s, true},  {0s, false},    {1s - 1ns, false}, {1ns, true}, {1s, true},
                 {-1h, true}, {999ms, false}, {-1ns, false},     {-2s, true}, {1h, true}};
    for (const auto& row : cases) {
        device.clock.advance(row.step);
        EXPECT_EQ(records(AudioEventTypeMemoryLog), row.isRecorded)
            << row.step.count() << " " << device.clock.seconds();
    }
}

TEST_F(MemoryLogWorkerTest, TheSessionsOwnTakesRepeatsAndNamesItsProcesses) {
    for (int i = 0; i < 2; ++i) {
        session->sendMessage(std::make_shared<ZRReportingSessionMessage>(
            Dictionary{{"processIDs", Array{7, 41}}}, 4, AudioEventTypeMemoryLog));
        device.clock.advance(1s);
    }
    ASSERT_THAT(device.memoryLog.requests, SizeIs(2));
    EXPECT_EQ(device.memoryLog.requests.back().reporterID, 5);
    EXPECT_THAT(device.memoryLog.requests.back().processes, ElementsAre(41, 7));
    session.reset();
    EXPECT_FALSE(records(AudioEventTypeMemoryLog));
}

TEST_F(MemoryLogWorkerTest, OtherMessagesCostNothing) {
    constexpr AudioEventType others[] = {0, 18, 20, 19 + 256, 65535};
    for (const AudioEventType type : others) {
        const auto message = messageOf(type);
        EXPECT_EQ(test::allocationsOf([&] { worker.handleMessage(message); }).blocks, 0U);
    }
    worker.handleMessage(nullptr);
    EXPECT_THAT(device.memoryLog.requests, testing::IsEmpty());
}

} // namespace
} // namespace tamblo
