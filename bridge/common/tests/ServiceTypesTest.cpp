#include "bridge/common/ServiceTypes.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <string>

namespace tamblo::bridge {
namespace {

TEST(BridgeServiceTypes, followRolesAndPreferences) {
    ServiceTypes types;
    EXPECT_EQ(types.of("Communication", ""), ServiceType::telephony);
    EXPECT_EQ(types.of("movie", ""), ServiceType::longFormAudio);
    EXPECT_EQ(types.of("event", ""), ServiceType::systemSounds);
    EXPECT_EQ(types.of("Alarm", ""), ServiceType::alarms);
    EXPECT_EQ(types.of("Game", ""), ServiceType::nonLongFormAudio);
    EXPECT_EQ(types.of("", ""), ServiceType::generic);
    EXPECT_EQ(types.of(std::string(65536, 'x'), ""), ServiceType::generic);

    const auto faults = types.setPreferences(
        {{"service_types", Dictionary{{"GAME", "longformaudio"}, {"none", "alerts"}, {"Music", "no such"}}},
         {"service_types_of_applications", Dictionary{{"org.example.phone", "telephony"}}}});
    EXPECT_THAT(faults, testing::ElementsAre(testing::HasSubstr("Music")));
    EXPECT_EQ(types.of("game", ""), ServiceType::longFormAudio);
    EXPECT_EQ(types.of("", ""), ServiceType::alerts);
    EXPECT_EQ(types.of("Music", ""), ServiceType::longFormAudio) << "as without the mistake";
    EXPECT_EQ(types.of("Music", "org.example.phone"), ServiceType::telephony);
    EXPECT_EQ(types.setPreferences({{"service_types", 1}}).size(), 1U);
    EXPECT_EQ(types.of("game", ""), ServiceType::nonLongFormAudio);
}

} // namespace
} // namespace tamblo::bridge
