#include "wire/Directories.h"

#include "tests/platform/LinuxServiceSupport.h"

#include <gmock/gmock.h>

#include <array>
#include <map>

namespace tamblo::wire {
namespace {

using testing::HasSubstr;

TEST(DirectoriesTest, ComeFromTheUnitOrFromTheirUsualPlaces) {
    const struct {
        std::map<std::string, std::string> variables;
        bool isRoot;
        std::array<std::string, 3> places; ///< of what runs, is configured and is logged
    } cases[] = {
        {{}, true, {"/run/tamblo", "/etc/tamblo", "/var/log/tamblo"}},
        {{{"RUNTIME_DIRECTORY", "/a:/b"}, {"CONFIGURATION_DIRECTORY", "/c/"}, {"LOGS_DIRECTORY", "/l"}},
         true,
         {"/a", "/c", "/l"}},
        {{{"XDG_RUNTIME_DIR", "/r/"}, {"XDG_CONFIG_HOME", "relative"}, {"XDG_STATE_HOME", "/s"}},
         false,
         {"/r/tamblo", "/h/.config/tamblo", "/s/tamblo"}},
        {{}, false, {"", "/h/.config/tamblo", "/h/.local/state/tamblo"}},
    };
    for (const auto& [variables, isRoot, places] : cases) {
        const auto found = Directories::find(
            {[named = variables](std::string_view name) mutable { return named[std::string(name)]; }, isRoot,
             "/h"});
        EXPECT_EQ((std::array{found.runtime, found.configuration, found.logs}), places);
    }
    const Environment bare{[](std::string_view) { return std::string(); }, false, "/h"};
    EXPECT_EQ(Directories::find(bare).socketFile(), "");
    EXPECT_THAT(std::get<std::string>(Directories::prepare(bare)), HasSubstr("XDG_RUNTIME_DIR"));
}

TEST(DirectoriesTest, AreCreatedForTheirOwnerAloneOrSayWhyNot) {
    const TemporaryDirectory home;
    const auto variable = [&home](std::string_view name) {
        return name == "LOGS_DIRECTORY" ? home.path("logs/deep") : home.path("x") + "/" + std::string(name);
    };
    for (int time = 0; time < 2; ++time) { // they may be there already
        const auto made = std::get<Directories>(Directories::prepare({variable, false, ""}));
        for (const std::string& path : {made.logs, home.path("logs"), made.notifications(),
                                        made.driverChannels(), made.preferences()}) {
            EXPECT_EQ(std::filesystem::status(path).permissions(), std::filesystem::perms::owner_all) << path;
        }
    }
    std::filesystem::remove_all(home.path("logs"));
    home.write("logs", "a file");
    EXPECT_THAT(std::get<std::string>(Directories::prepare({variable, false, ""})),
                HasSubstr(home.path("logs/deep") + ": Not a directory; create it, or set LOGS_DIRECTORY"));
}

} // namespace
} // namespace tamblo::wire
