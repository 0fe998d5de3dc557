#include "base/Cbor.h"
#include "tests/base/Samples.h"
#include "tests/service/RealService.h"
#include "wire/Vocabulary.h"

#include <gtest/gtest.h>
#include <nlohmann/json.hpp>

#include <array>
#include <map>
#include <set>
#include <span>

// The protocol's page, held against the service.

namespace tamblo::test {
namespace {

using Bytes = std::vector<std::uint8_t>;

/// What the protocol's page shows, in the order of the page.
struct Example {
    std::string heading;
    char sender; ///< 'C', 'S', or 'V' for a value of a table
    std::string notation;
    std::string hex;
};

std::vector<Example> examplesOfThePage() {
    std::ifstream page(EXAMPLES_DIR "/../docs/protocol.md");
    EXPECT_TRUE(page);
    std::vector<Example> examples;
    std::string heading;
    bool isInBlock = false;
    for (std::string line; std::getline(page, line);) {
        const std::string_view text = line;
        if (text.starts_with("```")) {
            isInBlock = !isInBlock;
        } else if (text.starts_with("#")) {
            heading = text.substr(text.find(' ') + 1);
        } else if (heading == "Values" && text.starts_with("| ") && text.find('`') != text.npos) {
            const std::size_t hexEnd = line.rfind('`');
            const std::size_t hexStart = line.rfind('`', hexEnd - 1) + 1;
            examples.push_back({heading, 'V', line, line.substr(hexStart, hexEnd - hexStart)});
        } else if (isInBlock && (text.starts_with("C: ") || text.starts_with("S: "))) {
            examples.push_back({heading, text[0], std::string(text.substr(3)), {}});
        } else if (isInBlock) {
            // Notation that goes on is indented further than bytes are.
            std::string& part = text.starts_with("    ") ? examples.back().notation : examples.back().hex;
            part.append(" ").append(text.substr(text.find_first_not_of(' ')));
        }
    }
    return examples;
}

/// The frame; an independent decoder knows whether it says what the notation says.
Bytes frameOf(const Example& example) {
    Bytes bytes = fromHex(example.hex);
    if (example.notation.starts_with('[')) {
        EXPECT_EQ(nlohmann::json::from_cbor(bytes.begin() + wire::kLengthBytes, bytes.end()),
                  nlohmann::json::parse(example.notation));
    }
    return bytes;
}

TEST(ProtocolDocument, TheServiceDoesWhatItShows) {
    ServiceProcess service;
    std::optional<RawClient> client(service.socketPath());
    std::set<wire::Method> shown;
    std::map<char, int> seen;
    for (const Example& example : examplesOfThePage()) {
        SCOPED_TRACE(example.notation);
        ++seen[example.sender];
        if (example.sender == 'V') {
            const Bytes item = fromHex(example.hex);
            CborReader reader(item);
            EXPECT_TRUE(reader.readValue() && reader.atEnd());
        } else if (example.sender == 'S') {
            EXPECT_EQ(client->receiveFrame(), frameOf(example));
        } else {
            const auto method = wire::methodNamed(example.heading);
            if (method) {
                shown.insert(*method);
            } else {
                client.emplace(service.socketPath());
            }
            const Bytes frame = frameOf(example);
            client->send({reinterpret_cast<const char*>(frame.data()), frame.size()});
            if (method == Method::killService) {
                EXPECT_EQ(service.awaitEnd(), 2);
                service.start();
            }
        }
    }
    EXPECT_EQ(shown.size(), wire::kMethods.size()) << "a method without an example";
    EXPECT_TRUE(seen['C'] >= 19 && seen['S'] >= 17 && seen['V'] >= 11);
    const std::string event =
        R"(,"event":"com.vandra.longformaudio.Playback.Start","payload":{)"
        R"("HostApplicationDisplayID":"com.example.player","audiotag":"PlaybackStart",)";
    EXPECT_EQ(service.countEvents(event), 2U);
}

TEST(ProtocolDocument, NumbersAreThoseOfTheVocabulary) {
    const std::string page = contentOf(EXAMPLES_DIR "/../docs/protocol.md");
    std::string wanted = "| number | subsystem |\n|---|---|\n";
    const auto addRow = [&wanted](const std::string& number, std::string_view name) {
        wanted.append("| ").append(number).append(" | `").append(name).append("` |\n");
    };
    const auto addTable = [&](std::string_view heading, std::span<const std::string_view> names,
                              std::size_t first) {
        wanted.append("\n| number | ").append(heading).append(" |\n|---|---|\n");
        for (std::size_t i = first; i < names.size(); ++i) {
            addRow(std::to_string(i), names[i]);
        }
    };
    for (const auto& [subsystem, name] : wire::kSubsystemNames) {
        std::array<char, 11> number{};
        std::snprintf(number.data(), number.size(), "0x%08x", static_cast<unsigned>(subsystem));
        addRow(number.data(), name);
    }
    addTable("kind", wire::kKindNames, 1);
    addTable("type", wire::kTypeNames, 0);
    addTable("service type", wire::kServiceNames, 0);
    EXPECT_NE(page.find(wanted), page.npos) << wanted;
}

} // namespace
} // namespace tamblo::test
