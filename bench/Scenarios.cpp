#include "Scenarios.h"

#include <array>

namespace tamblo::bench {

namespace {

constexpr std::array kScenarios{
    Scenario{"floor_socket", "the frames through a bare socket, read and dropped", floorSocket,
             Storages::none},
    Scenario{"floor_echo", "one frame to another process and back", floorEcho, Storages::none},
    Scenario{"floor_paced", "the same a thousand times a second, evenly", floorPaced, Storages::none},
    Scenario{"floor_job", "a bare program that decodes the messages and writes a line for each", floorJob,
             Storages::each},
    Scenario{"ingest_pipelined", "64 messages in flight, both events of each written", ingestPipelined,
             Storages::each},
    Scenario{"ingest_one_event", "the same with only the general event in use", ingestOneEvent,
             Storages::each},
    Scenario{"ingest_unwanted", "the same with no event in use", ingestUnwanted, Storages::each},
    Scenario{"ingest_repeated", "nine of ten messages redundant", ingestRepeated, Storages::each},
    Scenario{"ingest_all_sinks", "haptics use and issues among the messages, on two builds", ingestAllSinks,
             Storages::each},
    Scenario{"paced", "1,000 messages a second, evenly", paced, Storages::each},
    Scenario{"round_trip", "one message outstanding", roundTrip, Storages::each},
    Scenario{"broadcast", "messages to all of 1, 1,000 and 10,000 started sessions", broadcast,
             Storages::each},
    Scenario{"retained", "the cost of a message with 1,000,000 retained", retained},
    Scenario{"many_clients", "the cost of a message with 5,000 clients connected", manyClients},
    Scenario{"many_sessions", "10,000 started sessions", manySessions},
    Scenario{"stop_100k", "the stop of a session with 100,000 messages retained", stop100k, Storages::each},
    Scenario{"stop_stretches", "the stop of one with 40,000 stretches among 120,000 messages", stopStretches,
             Storages::each},
    Scenario{"stop_drivers", "what driver statistics add to a stop on an internal build", stopDrivers,
             Storages::each},
    Scenario{"stop_many", "another client's round trips while 10,000 sessions are stopped", stopMany},
    Scenario{"summary_json_100k", "the summary file of a session with 100,000 messages", summaryJson100k},
    Scenario{"idle", "nothing connected", idle},
    Scenario{"start_up", "from exec to the first accepted connection", startUp},
    Scenario{"hostile", "each attack on its own, with another user's client beside it", hostile,
             Storages::one, false},
};

} // namespace

std::span<const Scenario> allScenarios() {
    return kScenarios;
}

} // namespace tamblo::bench
