#include "platform/Limits.h"
#include "tests/fakes/FakeDevice.h"
#include "tools/Command.h"
#include "tools/KnownSettings.h"
#include "tools/TimeText.h"
#include "tools/records/Payload.h"
#include "tools/records/RecordFilter.h"
#include "util/LogCategories.h"
#include "wire/LogCodes.h"

#include <algorithm>
#include <array>
#include <bit>
#include <set>
#include <sstream>

#include <gmock/gmock.h>

// What a command line may say, and the tables that it is held against.

namespace tamblo::tools {
namespace {

/// The options as `NAME=VALUE;`, then the rest; or what is wrong.
std::string parsedText(const std::vector<std::string_view>& words) {
    static constexpr Option kOptions[] = {
        {.name = "--lines", .value = "N", .help = "", .letter = 'n'},
        {.name = "--follow", .value = "", .help = "", .letter = 'f', .excludes = "--quiet --sum"},
        {.name = "--key", .value = "K", .help = "", .letter = 'k', .isRepeatable = true},
        {.name = "--sum", .value = "", .help = ""},
    };
    const auto parsed = Arguments::parse(kOptions, words);
    if (const auto* wrong = std::get_if<std::string>(&parsed)) {
        return *wrong;
    }
    const auto& arguments = std::get<Arguments>(parsed);
    std::string text;
    for (const std::string_view name : {"--lines", "--follow", "--key", "--sum", "--help"}) {
        for (const std::string_view value : arguments.all(name)) {
            text.append(name).append("=").append(value).append(";");
        }
    }
    for (const std::string_view word : arguments.rest()) {
        text.append(word).append(" ");
    }
    return text;
}

TEST(Arguments, LettersNamesAndTheRestAreToldApart) {
    const std::pair<std::vector<std::string_view>, std::string_view> cases[] = {
        {{"a", "-n", "3", "-f", "b"}, "--lines=3;--follow=;a b "},
        {{"-fn3", "--key=x=y", "-k", "-h"}, "--lines=3;--follow=;--key=x=y;--key=-h;"},
        {{"-5", "-", "--", "-f", "--sum"}, "-5 - -f --sum "},
        {{"-fh"}, "--follow=;--help=;"},
        {{"-f", "-f"}, "--follow=;--follow=;"},
        {{"-n"}, "option \"-n\" needs a value: N"},
        {{"-x"}, "unknown option \"-x\""},
        {{"--follow=1"}, "option \"--follow\" takes no value"},
        {{"-n3", "--lines", "4"}, "option \"--lines\" is given more than once"},
        {{"--sum", "-f"}, "options \"--follow\" and \"--sum\" cannot go together"},
    };
    for (const auto& [words, text] : cases) {
        EXPECT_EQ(parsedText(words), text);
    }
}

TEST(Commands, TheirTablesHoldTogether) {
    for (const Command* const command : allCommands()) {
        std::set<std::string_view> names{kHelpOption.name, kVersionOption.name};
        std::set<char> letters{kHelpOption.letter, kVersionOption.letter};
        for (const Option& option : command->options) {
            EXPECT_TRUE(option.name.starts_with("--") && names.insert(option.name).second) << option.name;
            EXPECT_TRUE(option.letter == 0 || letters.insert(option.letter).second) << option.name;
        }
        for (const Option& option : command->options) {
            std::istringstream excluded{std::string(option.excludes)};
            for (std::string name; excluded >> name;) {
                EXPECT_TRUE(names.contains(name)) << command->name << " " << option.name;
            }
        }
        EXPECT_THAT(helpForAll(), testing::HasSubstr("\n  " + std::string(command->name) + " "));
    }
}

TEST(TimeText, MomentsAreReadAsPeopleTypeThem) {
    constexpr double now = 1772366400; // 2026-03-01T12:00:00Z
    const std::pair<std::string_view, std::optional<double>> cases[] = {
        {"2026-03-01", now - 43200},
        {"2026-03-01T12:00", now},
        {"2026-03-01 12:00:30.25", now + 30.25},
        {"2026-03-01T14:00:00+02:00", now},
        {"2026-03-01T11:30:00-0030", now},
        {"2024-02-29T00:00Z", 1709164800},
        {"90s", now - 90},
        {"1.5h", now - 5400},
        {"3d", now - 259200},
        {"1772366400.25", now + 0.25},
        {"2026-02-29", {}},
        {"2026-03-01T", {}},
        {"2026-03-01T24:00", {}},
        {"2026-03-01T12:00:00.Z", {}},
        {"2026-03-01T12:00x", {}},
        {"-5m", {}},
        {"m", {}},
        {"yesterday", {}},
        {"", {}},
    };
    for (const auto& [text, moment] : cases) {
        EXPECT_EQ(parseMoment(text, now), moment) << text;
    }
}

TEST(RecordFilter, FollowsTheSessionsOfAReporterAndKeepsToTheTime) {
    RecordFilter filter;
    filter.wantReporter(7);
    filter.wantSince(10);
    filter.wantUntil(20);
    const std::pair<const char*, bool> lines[] = {
        {R"({"time":9,"op":"open","session":"a.1","userInfo":{"ZRReportingSessionID":7}})", false},
        {R"({"time":10,"op":"message","session":"a.1","payload":{}})", true},
        {R"({"time":19.9,"op":"flush","session":"a.1"})", true},
        {R"({"time":20,"op":"message","session":"a.1","payload":{}})", false},
        {R"({"time":11,"op":"open","session":"a.2","userInfo":{"ZRReportingSessionID":8}})", false},
        {R"({"time":11,"op":"message","session":"a.2","payload":{"n":7}})", false},
        {R"({"time":12,"reporter":7,"processes":[]})", true},
        {R"({"time":12,"reporter":70,"processes":[]})", false},
        {R"({"op":"message","session":"a.1"})", false},
    };
    for (const auto& [line, isWanted] : lines) {
        const Dictionary record = std::get<Dictionary>(parseJsonObject(line));
        filter.noteSession(record);
        EXPECT_EQ(filter.accepts(record), isWanted) << line;
    }
}

TEST(KnownSettings, AreThoseOfTheService) {
    // Each known limit is one that the service reads.
    using Numbers = std::array<std::size_t, sizeof(Limits) / sizeof(std::size_t)>;
    const auto defaults = std::bit_cast<Numbers>(Limits{});
    std::size_t changed = 0;
    for (const KnownPreference& known : knownPreferences()) {
        FakePreferences preferences;
        preferences.setPreferenceValue(known.key, known.domain, 12345);
        changed += std::bit_cast<Numbers>(Limits::read(preferences)) == defaults ? 0U : 1U;
    }
    EXPECT_EQ(changed, defaults.size());

    std::vector<std::string_view> codes;
    std::transform(wire::kLogCodes.begin(), wire::kLogCodes.end(), std::back_inserter(codes),
                   [](const wire::LogCode& row) { return row.code; });
    std::vector<std::string_view> categories;
    for (const LogCategory& category : log_categories::all) {
        categories.push_back(category.code());
    }
    EXPECT_EQ(codes, categories);
}

TEST(KnownSettings, ValuesOfTheWrongKindAreTold) {
    const struct {
        PreferenceKind kind;
        std::vector<std::string_view> good;
        std::vector<std::string_view> bad;
    } cases[] = {
        {PreferenceKind::names, {"[]", R"(["a","b.*"])"}, {R"("a")", "[1]", R"([""])", "5"}},
        {PreferenceKind::limit, {"1", "4096"}, {"0", "-1", R"("5")", "[]"}},
        {PreferenceKind::octalText, {R"("0640")", R"("777")"}, {"640", R"("0888")", R"("1777")", R"("")"}},
        {PreferenceKind::flag, {"true", "0"}, {R"("yes")", "{}"}},
        {PreferenceKind::object, {"{}"}, {"[]"}},
    };
    for (const auto& row : cases) {
        for (const std::string_view text : row.good) {
            EXPECT_TRUE(isOfKind(row.kind, std::get<Value>(readJson(text)))) << text;
        }
        for (const std::string_view text : row.bad) {
            EXPECT_FALSE(isOfKind(row.kind, std::get<Value>(readJson(text)))) << text;
        }
    }
}

} // namespace
} // namespace tamblo::tools
