#include "Bench.h"

#include <algorithm>
#include <array>
#include <cstdio>
#include <cstring>
#include <exception>
#include <string>
#include <string_view>
#include <vector>

namespace {

using namespace tamblo::bench;

struct Scenario {
    std::string_view name;
    std::string_view what;
    void (*run)(Bench& bench);
    bool isRunUnasked = true;
};

constexpr std::array kScenarios{
    Scenario{"floor_socket", "the frames through a bare socket, read and dropped", floorSocket},
    Scenario{"floor_echo", "one frame to another process and back", floorEcho},
    Scenario{"floor_paced", "the same a thousand times a second, evenly", floorPaced},
    Scenario{"ingest_pipelined", "64 messages in flight, both events of each written", ingestPipelined},
    Scenario{"ingest_one_event", "the same with only the general event in use", ingestOneEvent},
    Scenario{"ingest_unwanted", "the same with no event in use", ingestUnwanted},
    Scenario{"ingest_repeated", "nine of ten messages redundant", ingestRepeated},
    Scenario{"ingest_all_sinks", "haptics use and issues among the messages, call quality on",
             ingestAllSinks},
    Scenario{"paced", "1,000 messages a second, evenly", paced},
    Scenario{"round_trip", "one message outstanding", roundTrip},
    Scenario{"retained", "the cost of a message with 1,000,000 retained", retained},
    Scenario{"many_clients", "the cost of a message with 5,000 clients connected", manyClients},
    Scenario{"many_sessions", "10,000 started sessions", manySessions},
    Scenario{"stop_100k", "the stop of a session with 100,000 messages retained", stop100k},
    Scenario{"stop_many", "another client's round trips while 10,000 sessions are stopped", stopMany},
    Scenario{"summary_json_100k", "the summary file of a session with 100,000 messages", summaryJson100k},
    Scenario{"idle", "nothing connected", idle},
    Scenario{"start_up", "from exec to the first accepted connection", startUp},
    Scenario{"hostile", "each attack on its own, with another user's client beside it", hostile, false},
};

struct Options {
    std::string tamblod = TAMBLOD_PATH;
    bool quick = false;
    std::vector<const Scenario*> scenarios;
    std::vector<std::string> attacks;
};

int usage() {
    std::fputs("usage: tamblo_bench [--quick] [--tamblod PATH] [SCENARIO | hostile:ATTACK...]\n\n"
               "Prints one JSON object per row. Exit status: 0 when all ran, whether or not they met their\n"
               "targets; 1 when one could not run; 2 for a wrong command line.\n\n",
               stderr);
    for (const Scenario& scenario : kScenarios) {
        std::fprintf(stderr, "  %-19s%s\n", scenario.name.data(), scenario.what.data());
    }
    printAttacks();
    return 2;
}

/// Several attacks of one scenario make it run once.
void add(const Scenario& scenario, Options& options) {
    auto& chosen = options.scenarios;
    if (scenario.isRunUnasked || std::find(chosen.begin(), chosen.end(), &scenario) == chosen.end()) {
        chosen.push_back(&scenario);
    }
}

bool parse(int count, char** arguments, Options& options) {
    for (int i = 1; i < count; ++i) {
        const std::string_view argument = arguments[i];
        if (argument == "--quick") {
            options.quick = true;
        } else if (argument == "--tamblod" && i + 1 < count) {
            options.tamblod = arguments[++i];
        } else {
            bool known = false;
            const std::size_t colon = argument.find(':');
            const std::string_view name = argument.substr(0, colon);
            for (const Scenario& scenario : kScenarios) {
                if (scenario.name == name) {
                    add(scenario, options);
                    known = true;
                }
            }
            if (!known || (colon != argument.npos && name != "hostile")) {
                return false;
            }
            if (colon != argument.npos) {
                options.attacks.emplace_back(argument.substr(colon + 1));
            }
        }
    }
    if (options.scenarios.empty()) {
        for (const Scenario& scenario : kScenarios) {
            if (scenario.isRunUnasked) {
                options.scenarios.push_back(&scenario);
            }
        }
    }
    return true;
}

} // namespace

int main(int count, char** arguments) {
    Options options;
    if (!parse(count, arguments, options)) {
        return usage();
    }
    Bench bench(options.tamblod, options.quick, options.attacks);
    bool allRan = true;
    for (const Scenario* scenario : options.scenarios) {
        try {
            scenario->run(bench);
        } catch (const std::exception& error) {
            ResultRow row(scenario->name);
            row.set("error", error.what());
            bench.print(row);
            allRan = false;
        }
    }
    return allRan ? 0 : 1;
}
