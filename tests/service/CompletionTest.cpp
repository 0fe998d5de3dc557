#include "tests/service/RealService.h"

#include <gmock/gmock.h>

// What an installation has of tambloctl besides the program: completion of command lines, and manual pages.

namespace tamblo::test {
namespace {

using testing::AllOf;
using testing::HasSubstr;
using testing::Not;

/// What bash, with the generated script, offers for the last of these words.
std::string offered(const std::string& words) {
    return run("bash --norc -c 'source <(" TAMBLOCTL_PATH " generate bash); COMP_WORDS=(" + words +
               "); COMP_CWORD=$((${#COMP_WORDS[@]} - 1)); _tambloctl; echo \" ${COMPREPLY[*]} \"'")
        .output;
}

TEST(Completion, OffersCommandsOptionsAndWordsInBash) {
    EXPECT_THAT(offered("tambloctl se"), AllOf(HasSubstr(" send session "), Not(HasSubstr("tail"))));
    EXPECT_THAT(offered("tambloctl help va"), HasSubstr(" validate "));
    EXPECT_THAT(offered("tambloctl tail --f"), HasSubstr(" --follow "));
    EXPECT_THAT(offered("tambloctl tail power"), HasSubstr(" power-events "));
    EXPECT_THAT(offered("tambloctl list ty"), HasSubstr(" types "));
    EXPECT_THAT(offered("tambloctl send -c Session_PlaybackA"), HasSubstr(" Session_PlaybackAndRecord "));
    EXPECT_THAT(offered("tambloctl session --service-type lon"), HasSubstr(" longformaudio "));
}

TEST(Completion, HasEveryOptionThatTheHelpHas) {
    const std::string names = run(TAMBLOCTL_PATH " generate names").output;
    const std::string zsh = run(TAMBLOCTL_PATH " generate zsh").output;
    std::istringstream all(names);
    for (std::string name; std::getline(all, name);) {
        const std::string bash = offered("tambloctl " + name + " -");
        const std::string page = run(TAMBLOCTL_PATH " generate manual " + name).output;
        std::istringstream help(run(TAMBLOCTL_PATH " help " + name +
                                    " | grep -oE '^ +(-., )?--[a-z-]+' | "
                                    "grep -oE -- '--[a-z-]+'")
                                    .output);
        for (std::string option; std::getline(help, option);) {
            EXPECT_THAT(bash, HasSubstr(" " + option + " ")) << name;
            EXPECT_THAT(zsh, HasSubstr(option + "[")) << name;
            std::string escaped;
            for (const char character : option) {
                escaped.append(character == '-' ? "\\-" : std::string(1, character));
            }
            EXPECT_THAT(page, HasSubstr("\\fB" + escaped + "\\fR")) << name;
        }
    }
    EXPECT_THAT(names, HasSubstr("tail\n"));
}

} // namespace
} // namespace tamblo::test
