#include "Options.h"

#include <algorithm>
#include <charconv>
#include <cstdio>
#include <string_view>

namespace tamblo::bench {

namespace {

constexpr std::size_t kUsualRoundsOfTwoBuilds = 3;

} // namespace

void printUsage() {
    std::fputs(
        "usage: tamblo_bench [OPTION...] [SCENARIO | hostile:ATTACK...]\n\n"
        "Prints one JSON object per row, and a table of them in the end. Exit status: 0 when all ran,\n"
        "whether or not they met their targets; 1 when one could not run; 2 for a wrong command line.\n\n"
        "  --quick            fewer repetitions\n"
        "  --storage WHERE    where the service writes: tmpfs, disk or both (the default: what writes\n"
        "                     much runs on both, the rest on a disk)\n"
        "  --json FILE        keeps the rows in a file, too\n"
        "  --tamblod PATH     the service, instead of the one built with this program\n"
        "  --against PATH     another build of the service (\"before\"), run by turns with the one\n"
        "                     (\"after\"); rows and table have the medians of all rounds\n"
        "  --rounds N         how often each scenario runs (1; with --against 3)\n\n",
        stderr);
    for (const Scenario& scenario : allScenarios()) {
        std::fprintf(stderr, "  %-19s%s\n", scenario.name.data(), scenario.what.data());
    }
    printAttacks();
}

bool Options::takeValue(std::string_view option, const char* value) {
    const std::string_view text(value);
    if (option == "--tamblod") {
        tamblod = text;
    } else if (option == "--against") {
        against = text;
    } else if (option == "--json") {
        jsonFile = text;
    } else if (option == "--rounds") {
        const auto [end, error] = std::from_chars(text.data(), text.data() + text.size(), rounds);
        return error == std::errc() && end == text.data() + text.size() && rounds > 0;
    } else if (text != "both") {
        storages = {text == "tmpfs" ? Storage::tmpfs : Storage::disk};
        return text == describe(storages.front());
    }
    return true;
}

bool Options::takeScenario(std::string_view argument) {
    const std::size_t colon = argument.find(':');
    const std::string_view name = argument.substr(0, colon);
    const auto all = allScenarios();
    const auto found =
        std::find_if(all.begin(), all.end(), [&](const Scenario& scenario) { return scenario.name == name; });
    if (found == all.end() || (colon != argument.npos && name != "hostile")) {
        return false;
    }
    // Several attacks of one scenario make it run once.
    if (std::find(scenarios.begin(), scenarios.end(), &*found) == scenarios.end()) {
        scenarios.push_back(&*found);
    }
    if (colon != argument.npos) {
        attacks.emplace_back(argument.substr(colon + 1));
    }
    return true;
}

bool Options::parse(int count, char** arguments) {
    constexpr std::string_view kWithValue[] = {"--tamblod", "--against", "--json", "--rounds", "--storage"};
    for (int i = 1; i < count; ++i) {
        const std::string_view argument = arguments[i];
        bool isRight = true;
        if (argument == "--quick") {
            quick = true;
        } else if (std::find(std::begin(kWithValue), std::end(kWithValue), argument) !=
                   std::end(kWithValue)) {
            isRight = i + 1 < count && takeValue(argument, arguments[i + 1]);
            ++i;
        } else {
            isRight = takeScenario(argument);
        }
        if (!isRight) {
            return false;
        }
    }
    if (rounds == 0) {
        rounds = against.empty() ? 1 : kUsualRoundsOfTwoBuilds;
    }
    if (scenarios.empty()) {
        for (const Scenario& scenario : allScenarios()) {
            // A floor is no different for another build.
            if (scenario.isRunUnasked && (against.empty() || !scenario.isFloor())) {
                scenarios.push_back(&scenario);
            }
        }
    }
    return true;
}

} // namespace tamblo::bench
