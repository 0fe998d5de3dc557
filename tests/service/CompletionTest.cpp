#include "tests/service/RealService.h"

#include <gmock/gmock.h>

// What an installation has of tambloctl besides the program: completion of command lines, and manual pages.

namespace tamblo::test {
namespace {

using testing::AllOf;
using testing::AnyOf;
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
    EXPECT_THAT(offered("tambloctl session --service-type = lon"), HasSubstr(" longformaudio "));
    EXPECT_THAT(offered("tambloctl top --sort m"), HasSubstr(" messages "));
    EXPECT_THAT(offered("tambloctl preference get com.vandra.tamblo.a"),
                HasSubstr(" com.vandra.tamblo.analytics "));
    EXPECT_THAT(offered("tambloctl preference get com.vandra.tamblo.analytics ev"),
                HasSubstr(" events_in_use "));
    EXPECT_THAT(offered("tambloctl session show sh"), Not(HasSubstr("show")));
    EXPECT_THAT(offered("tambloctl notify com.vandra.d"), HasSubstr(" com.vandra.dashlo.ringerstate "));
}

TEST(Completion, HasEveryOptionThatTheHelpHas) {
    const std::string names = run(TAMBLOCTL_PATH " generate names").output;
    const std::string zsh = run(TAMBLOCTL_PATH " generate zsh").output;
    const CommandResult read =
        run("! command -v zsh >/dev/null || " TAMBLOCTL_PATH " generate zsh | zsh -f -n /dev/stdin");
    EXPECT_TRUE(read.status == 0 && read.output.empty()) << read.output;
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
            EXPECT_THAT(zsh, AnyOf(HasSubstr(option + "["), HasSubstr(option + "=["))) << name;
            std::string escaped;
            for (const char character : option) {
                escaped.append(character == '-' ? "\\-" : std::string(1, character));
            }
            EXPECT_THAT(page, HasSubstr("\\fB" + escaped + "\\fR")) << name;
        }
    }
    EXPECT_THAT(names, HasSubstr("tail\n"));
}

TEST(Manual, HasAPageForEachFunctionOfTheLibraryThatSaysWhatItDoes) {
    const TemporaryDirectory share;
    const std::string tree = EXAMPLES_DIR "/..";
    const CommandResult made =
        run(tree + "/packaging/manual $(dirname " TAMBLOCTL_PATH ") " + share.path("share"));
    ASSERT_EQ(made.status, 0) << made.output;
    const std::string pages = share.path("share/man/man3/");
    const std::string library = contentOf(pages + "libtamblo.3");
    std::istringstream shown(
        run("sed -n 's/^ \\(tamblo_[a-z_]*\\)@.*/\\1/p' " + tree + "/packaging/debian/libtamblo1.symbols")
            .output);
    int functions = 0;
    for (std::string name; std::getline(shown, name); ++functions) {
        EXPECT_THAT(contentOf(pages + name + ".3"), testing::StartsWith(".so man3/libtamblo.3")) << name;
        EXPECT_THAT(library, HasSubstr(name + "(")) << name;
    }
    EXPECT_GT(functions, 20);
    for (const char* part : {"\n.SH TYPES\n", "\n.SH FUNCTIONS\n",
                             "\nWhether all that was queued left within this time.\n", "int main(void) {"}) {
        EXPECT_THAT(library, HasSubstr(part));
    }
    EXPECT_THAT(library, Not(HasSubstr("*/\n.RE")));
}

} // namespace
} // namespace tamblo::test
