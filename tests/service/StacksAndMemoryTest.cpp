#include "tests/service/RawClient.h"
#include "tests/service/ServiceProcess.h"

#include <gmock/gmock.h>
#include <nlohmann/json.hpp>

#include <string>

#include <unistd.h>

// What clients' processes hold and where they wait, from the socket to the files, with this very process as
// the client.

namespace tamblo::test {
namespace {

using Json = nlohmann::ordered_json;

std::vector<std::string> namesOf(const Json& object) {
    std::vector<std::string> names;
    for (const auto& [name, value] : object.items()) {
        names.push_back(name);
    }
    return names;
}

/// The file's only line, once it is there.
Json lineOf(const std::filesystem::path& file) {
    EXPECT_TRUE(eventually([&] { return readFile(file).ends_with('\n'); }));
    return Json::parse(readFile(file), nullptr, false);
}

TEST(StacksAndMemory, TheMemoryLogKnowsTheClientAndWhomThePayloadNames) {
    ServiceProcess service;
    RawClient client(service.socketPath());
    startSession(client, 7);
    ASSERT_TRUE(client.call(message({{"processIDs", Array{service.pid(), -1}}}, {7}, 4, 19)));
    const Json line = lineOf(service.logs() / "memory-log.jsonl");
    EXPECT_THAT(namesOf(line), testing::ElementsAre("time", "reporter", "processes", "kernel"));
    EXPECT_EQ(line["reporter"], 7);
    ASSERT_EQ(line["processes"].size(), 2U);
    EXPECT_EQ(line["processes"][0]["process"], ::getpid());
    EXPECT_EQ(line["processes"][1]["process"], service.pid());
    EXPECT_EQ(line["processes"][1]["name"], "tamblod");
    EXPECT_GT(line["processes"][1]["resident"], 100'000);
    EXPECT_GT(line["kernel"]["slab"], 100'000);
}

TEST(StacksAndMemory, AnOverloadCapturesWhereTheClientsThreadsAre) {
    ServiceProcess service;
    service.stop();
    writeFile(service.directory() / "config" / "device-properties.json", R"({"InternalBuild": true})");
    writeFile(service.preferenceFile("com.vandra.tamblo.zrreporting"), R"({"enable_stackburst": true})");
    service.start();
    RawClient client(service.socketPath());
    startSession(client, 7);
    ASSERT_TRUE(client.call(message({{"smallest_buffer_frame_size", 512}}, {7}, 7, 6)));
    // The capture is taken at the service's end at the latest.
    EXPECT_EQ(service.stop(), 0);
    const Json line = lineOf(service.logs() / "stack-captures.jsonl");
    EXPECT_THAT(namesOf(line), testing::ElementsAre("time", "requester", "captureType", "reason", "payload",
                                                    "options", "stacks"));
    EXPECT_EQ(line["options"], Json({1, 1, 0, 0, 0}));
    ASSERT_EQ(line["stacks"].size(), 1U);
    EXPECT_EQ(line["stacks"][0]["process"], ::getpid());
    EXPECT_EQ(line["stacks"][0]["threads"][0]["thread"], ::getpid());
    int samples = 0;
    for (const Json& sample : line["stacks"][0]["threads"][0]["samples"]) {
        samples += sample["count"].get<int>();
        EXPECT_FALSE(sample["state"].get<std::string>().empty());
    }
    EXPECT_EQ(samples, 5);
}

} // namespace
} // namespace tamblo::test
