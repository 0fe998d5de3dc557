#include "wire/Directories.h"

#include "tests/platform/LinuxServiceSupport.h"

#include <gmock/gmock.h>

#include <array>
#include <map>

namespace tamblo::wire {
namespace {

using testing::AllOf;
using testing::HasSubstr;

TEST(DirectoriesTest, ComeFromTheUnitOrFromTheirUsualPlaces) {
    using Variables = std::map<std::string, std::string, std::less<>>;
    const struct {
        Variables variables;
        bool isRoot;
        std::array<std::string, 3> places; ///< of what runs, is configured and is logged
    } cases[] = {
        {{}, true, {"/run/tamblo", "/etc/tamblo", "/var/log/tamblo"}},
        {{{"RUNTIME_DIRECTORY", "/a:/b"}, {"CONFIGURATION_DIRECTORY", "/c/"}, {"LOGS_DIRECTORY", "/l"}},
         true,
         {"/a", "/c", "/l"}},
        {{{"XDG_RUNTIME_DIR", "/run/user/7"}, {"LOGS_DIRECTORY", ""}},
         false,
         {"/run/user/7/tamblo", "/h/.config/tamblo", "/h/.local/state/tamblo"}},
        {{{"XDG_RUNTIME_DIR", "/r/"}, {"XDG_CONFIG_HOME", "relative"}, {"XDG_STATE_HOME", "/s"}},
         false,
         {"/r/tamblo", "/h/.config/tamblo", "/s/tamblo"}},
        {{}, false, {"", "/h/.config/tamblo", "/h/.local/state/tamblo"}},
    };
    for (const auto& [variables, isRoot, places] : cases) {
        const auto variable = [&variables](std::string_view name) {
            const auto found = variables.find(name);
            return found == variables.end() ? std::string() : found->second;
        };
        const auto found = Directories::find({variable, isRoot, "/h"});
        EXPECT_EQ((std::array{found.runtime, found.configuration, found.logs}), places);
    }
    const Environment bare{[](std::string_view) { return std::string(); }, false, "/h"};
    EXPECT_EQ(Directories::find(bare).socketFile(), "");
    EXPECT_THAT(std::get<std::string>(Directories::prepare(bare)),
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

} // namespace
} // namespace tamblo::wire
