#include "tests/client/FakeService.h"

#include <cstdint>

#include <gtest/gtest.h>

extern "C" int runCProgram(const char* socketPath, int hasOwnThread);

namespace tamblo::client {
namespace {

TEST(CApi, ACProgramRunsASessionAndItsPayloadArrivesAsItWasBuilt) {
    test::FakeService service;
    EXPECT_EQ(runCProgram(service.path().c_str(), 0), 0);
    EXPECT_EQ(runCProgram(service.path().c_str(), 1), 0);
    ASSERT_TRUE(service.waitForRequests(18));
    const std::uint8_t bytes[] = {0, 1, 255};
    const Dictionary expected{
        {"string", "text"}, {"int", -5},    {"uint", ~std::uint64_t{0}}, {"double", 0.1},
        {"float", 0.5F},    {"bool", true}, {"date", Value::date(1.5)},  {"data", Value::data(bytes)}};
    const auto requests = service.requests();
    EXPECT_EQ(requests[4].dictionary, expected);
    EXPECT_EQ(requests[4].dictionary.find("float")->kind(), Value::Kind::singleFloat);
    EXPECT_EQ(requests[4].category, 0x08000004U);
    EXPECT_TRUE(requests[5].reporterIDs.empty());
    EXPECT_FALSE(requests[5].id);
}

} // namespace
} // namespace tamblo::client
