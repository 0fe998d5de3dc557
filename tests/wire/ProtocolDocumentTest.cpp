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

    [[nodiscard]] Bytes bytes() const { return test::fromHex(hex); }
    /// The one item of the one frame, which says what the notation says; an independent decoder knows.
    [[nodiscard]] Bytes item() const {
        const Bytes all = bytes();
        FrameSplitter frames(all);
        const auto frame = frames.next();
        EXPECT_TRUE(frame && frames.rest().empty()) << "not one whole frame: " << notation;
        const Bytes item = frame ? Bytes(frame->begin(), frame->end()) : Bytes();
        if (notation.starts_with('[')) {
            EXPECT_EQ(nlohmann::json::from_cbor(item), nlohmann::json::parse(notation));
        }
        return item;
    }
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

TEST(ProtocolDocument, EveryExampleIsReadAsThePageSays) {
    KeySetCache keySets;
    const std::vector<Example> examples = examplesOfThePage();
    std::set<Method> shown;
    int refusals = 0;
    int replies = 0;
    int values = 0;
    for (std::size_t i = 0; i < examples.size(); ++i) {
        const Example& example = examples[i];
        SCOPED_TRACE(example.notation);
        if (example.sender == 'S') {
            EXPECT_TRUE(decodeReply(example.item()));
            ++replies;
            continue;
        }
        if (example.sender == 'V') {
            const Bytes item = example.bytes();
            CborReader reader(item);
            EXPECT_TRUE(reader.readValue() && reader.atEnd());
            ++values;
            continue;
        }
        Request request;
        const auto refusal = decodeRequest(example.item(), keySets, request);
        if (const auto method = methodNamed(example.heading)) {
            ASSERT_FALSE(refusal) << refusal->error.message;
            EXPECT_EQ(request.method, *method);
            shown.insert(*method);
        } else if (example.heading == "Errors") {
            ASSERT_TRUE(refusal);
            TextBuffer answer;
            appendErrorReply(answer, refusal->id, refusal->error);
            EXPECT_TRUE(std::ranges::equal(answer.bytes(), examples.at(i + 1).bytes()))
                << refusal->error.message;
            ++refusals;
        }
    }
    EXPECT_EQ(shown.size(), kMethods.size()) << "a method without an example";
    EXPECT_GE(refusals, 5);
    EXPECT_GE(replies, 11);
    EXPECT_GE(values, 11);
}

} // namespace
} // namespace tamblo::wire
