#include "base/Cbor.h"
#include "tests/base/Hex.h"
#include "wire/FrameSplitter.h"
#include "wire/Reply.h"
#include "wire/Request.h"

#include <gtest/gtest.h>
#include <nlohmann/json.hpp>

#include <cstdint>
#include <fstream>
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
    /// The one item of the one frame.
    [[nodiscard]] Bytes item() const {
        const Bytes all = bytes();
        FrameSplitter frames(all);
        const auto frame = frames.next();
        EXPECT_TRUE(frame && frames.rest().empty()) << "not one whole frame: " << notation;
        return frame ? Bytes(frame->begin(), frame->end()) : Bytes();
    }
};

std::string withoutCodeMarks(std::string_view cell) {
    const std::size_t start = cell.find('`') + 1;
    return std::string(cell.substr(start, cell.rfind('`') - start));
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
            const std::size_t hexCell = text.rfind('|', text.size() - 2);
            const std::string_view notation = text.substr(0, hexCell);
            examples.push_back(
                {heading, 'V', withoutCodeMarks(notation), withoutCodeMarks(text.substr(hexCell))});
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

/// Held against an independent decoder, so that notation and bytes say the same.
void expectNotationToMatch(const Example& example, const Bytes& item) {
    if (example.notation.starts_with('[')) {
        EXPECT_EQ(nlohmann::json::from_cbor(item), nlohmann::json::parse(example.notation));
    }
}

TEST(ProtocolDocument, RequestsAreOfTheMethodTheyStandUnder) {
    KeySetCache keySets;
    std::vector<bool> isShown(kMethods.size());
    for (const Example& example : examplesOfThePage()) {
        const auto method = methodNamed(example.heading);
        if (example.sender != 'C' || !method) {
            continue;
        }
        SCOPED_TRACE(example.notation);
        const Bytes item = example.item();
        Request request;
        const auto refusal = decodeRequest(item, keySets, request);
        ASSERT_FALSE(refusal) << refusal->error.message;
        EXPECT_EQ(request.method, *method);
        expectNotationToMatch(example, item);
        isShown[static_cast<std::size_t>(*method)] = true;
    }
    for (std::size_t i = 0; i < kMethods.size(); ++i) {
        EXPECT_TRUE(isShown[i]) << "no example of " << kMethods[i].name;
    }
}

TEST(ProtocolDocument, RepliesAreAsTheServiceWritesThem) {
    int replies = 0;
    for (const Example& example : examplesOfThePage()) {
        if (example.sender != 'S') {
            continue;
        }
        SCOPED_TRACE(example.notation);
        const Bytes item = example.item();
        EXPECT_TRUE(decodeReply(item));
        expectNotationToMatch(example, item);
        ++replies;
    }
    EXPECT_GE(replies, 11);
}

TEST(ProtocolDocument, RefusalsAreTheOnesShown) {
    KeySetCache keySets;
    const std::vector<Example> examples = examplesOfThePage();
    int refusals = 0;
    for (std::size_t i = 0; i + 1 < examples.size(); ++i) {
        if (examples[i].sender != 'C' || examples[i].heading != "Errors") {
            continue;
        }
        SCOPED_TRACE(examples[i].notation);
        Request request;
        const auto refusal = decodeRequest(examples[i].item(), keySets, request);
        const Bytes shown = examples[i + 1].bytes();
        ASSERT_TRUE(refusal);
        TextBuffer answer;
        appendErrorReply(answer, refusal->id, refusal->error);
        EXPECT_TRUE(std::equal(shown.begin(), shown.end(), answer.bytes().begin(), answer.bytes().end()))
            << refusal->error.message;
        ++refusals;
    }
    EXPECT_GE(refusals, 4);
}

TEST(ProtocolDocument, ValuesAreAccepted) {
    int values = 0;
    for (const Example& example : examplesOfThePage()) {
        if (example.sender == 'V') {
            const Bytes item = example.bytes();
            CborReader reader(item);
            EXPECT_TRUE(reader.readValue() && reader.atEnd()) << example.notation;
            ++values;
        }
    }
    EXPECT_GE(values, 11);
}

} // namespace
} // namespace tamblo::wire
