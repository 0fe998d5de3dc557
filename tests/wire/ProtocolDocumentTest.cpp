#include "base/Cbor.h"
#include "tests/base/Samples.h"
#include "wire/FrameSplitter.h"
#include "wire/Reply.h"
#include "wire/Request.h"

#include <gtest/gtest.h>
#include <nlohmann/json.hpp>

#include <algorithm>
#include <cstdint>
#include <fstream>
#include <map>
#include <set>
#include <string>
#include <string_view>
#include <vector>

namespace tamblo::wire {
namespace {

using Bytes = std::vector<std::uint8_t>;

/// What the protocol's page shows, in the order of the page.
struct Example {
    std::string heading;
    char sender; ///< 'C', 'S', or 'V' for a value of a table
    std::string notation;
    std::string hex;
};

/// The one item of the one frame, which says what the notation says; an independent decoder knows.
Bytes itemOf(const Example& example) {
    const Bytes all = test::fromHex(example.hex);
    FrameSplitter frames(all);
    const auto frame = frames.next().value();
    EXPECT_TRUE(frames.rest().empty()) << "more than one frame";
    if (example.notation.starts_with('[')) {
        EXPECT_EQ(nlohmann::json::from_cbor(frame), nlohmann::json::parse(example.notation));
    }
    return {frame.begin(), frame.end()};
}

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

TEST(ProtocolDocument, EveryExampleIsReadAsThePageSays) {
    KeySetCache keySets;
    const std::vector<Example> examples = examplesOfThePage();
    std::set<Method> shown;
    std::map<std::string, int> seen;
    for (std::size_t i = 0; i < examples.size(); ++i) {
        const auto& [heading, sender, notation, hex] = examples[i];
        SCOPED_TRACE(notation);
        if (sender == 'S') {
            EXPECT_TRUE(decodeReply(itemOf(examples[i])));
            ++seen["replies"];
            continue;
        }
        if (sender == 'V') {
            const Bytes item = test::fromHex(hex);
            CborReader reader(item);
            EXPECT_TRUE(reader.readValue() && reader.atEnd());
            ++seen["values"];
            continue;
        }
        Request request;
        const auto refusal = decodeRequest(itemOf(examples[i]), keySets, request);
        if (const auto method = methodNamed(heading)) {
            ASSERT_FALSE(refusal) << refusal->error.message;
            EXPECT_EQ(request.method, *method);
            shown.insert(*method);
        } else if (heading == "Errors") {
            ASSERT_TRUE(refusal);
            TextBuffer answer;
            appendErrorReply(answer, refusal->id, refusal->error);
            EXPECT_TRUE(std::ranges::equal(answer.bytes(), test::fromHex(examples.at(i + 1).hex)))
                << refusal->error.message;
            ++seen["refusals"];
        }
    }
    EXPECT_EQ(shown.size(), kMethods.size()) << "a method without an example";
    EXPECT_TRUE(seen["refusals"] >= 5 && seen["replies"] >= 11 && seen["values"] >= 11);
}

} // namespace
} // namespace tamblo::wire
