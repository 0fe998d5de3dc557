#include "tools/Decode.h"

#include "base/Cbor.h"
#include "base/Format.h"
#include "base/JsonObject.h"
#include "base/NumberText.h"
#include "client/Vocabulary.h"
#include "wire/FrameSplitter.h"
#include "wire/Reply.h"
#include "wire/Request.h"

#include <cstdint>
#include <span>

namespace tamblo::tools {

namespace {

using Bytes = std::span<const std::uint8_t>;

/// Nothing when it is another text, or the number of digits is odd.
std::optional<std::vector<std::uint8_t>> bytesOfHex(std::string_view text) {
    std::vector<std::uint8_t> bytes;
    bytes.reserve(text.size() / 2);
    std::string pair;
    for (const char character : text) {
        if (std::string_view(" \t\r\n").find(character) != std::string_view::npos) {
            continue;
        }
        if (pair.append(1, character).size() < 2) {
            continue;
        }
        const auto byte = parseNumber<std::uint8_t>(pair, 16);
        if (!byte) {
            return std::nullopt;
        }
        bytes.push_back(*byte);
        pair.clear();
    }
    return pair.empty() ? std::optional(std::move(bytes)) : std::nullopt;
}

/// Nothing for what has no name.
void addName(JsonObject& object, std::string_view member, std::string_view name) {
    if (!name.empty()) {
        object.value(member, name);
    }
}

void addParameter(JsonObject& object, wire::Parameter parameter, const wire::Request& request) {
    switch (parameter) {
    case wire::Parameter::none:
        break;
    case wire::Parameter::payload:
        object.value("payload", request.dictionary);
        break;
    case wire::Parameter::configuration:
        object.value("configuration", request.dictionary);
        break;
    case wire::Parameter::category:
        object.value("category", request.category);
        addName(object, "categoryName", client::categoryName(client::EventCategory{request.category}));
        break;
    case wire::Parameter::type:
        object.value("type", unsigned{request.type});
        addName(object, "typeName", client::typeName(client::EventType{request.type}));
        break;
    case wire::Parameter::serviceType:
        object.value("type", unsigned{request.serviceType});
        addName(object, "typeName", client::serviceTypeName(client::ServiceType{request.serviceType}));
        break;
    case wire::Parameter::reporterID:
        object.value("reporterID", request.reporterID);
        break;
    case wire::Parameter::reporterIDs:
        object.value("reporterIDs", Array(request.reporterIDs.begin(), request.reporterIDs.end()));
        break;
    }
}

void appendObject(TextBuffer& out, const wire::Request& request) {
    JsonObject object(out);
    object.value("frame", request.id ? "request" : "request without reply");
    if (request.id) {
        object.value("id", *request.id);
    }
    object.value("method", wire::rowOf(request.method).name);
    for (const wire::Parameter parameter : wire::parametersOf(request.method)) {
        addParameter(object, parameter, request);
    }
}

void appendObject(TextBuffer& out, const wire::Reply& reply) {
    JsonObject object(out);
    object.value("frame", "reply").value("id", reply.id);
    if (reply.error) {
        Dictionary error{{"domain", reply.error->domain}, {"code", reply.error->code}};
        if (!reply.error->message.empty()) {
            error.set("message", reply.error->message);
        }
        object.value("error", error);
    } else {
        object.null("error");
    }
    if (reply.result) {
        object.value("result", *reply.result);
    } else {
        object.null("result");
    }
}

template <typename Frame> std::string lineOf(const Frame& frame) {
    TextBuffer line;
    appendObject(line, frame);
    line.append('\n');
    return std::string(line.view());
}

bool beginsLikeAReply(Bytes item) {
    CborReader reader(item);
    auto elements = reader.readArrayHead();
    return elements && reader.moreElements(*elements) &&
           reader.readUnsigned() == static_cast<std::uint64_t>(wire::FrameKind::reply);
}

/// What is wrong with the item, if anything.
std::optional<std::string> appendItem(std::string& out, Bytes item) {
    if (const auto reply = wire::decodeReply(item)) {
        out += lineOf(*reply);
        return std::nullopt;
    }
    KeySetCache keySets;
    wire::Request request;
    const auto refusal = wire::decodeRequest(item, keySets, request);
    if (!refusal) {
        out += lineOf(request);
        return std::nullopt;
    }
    if (refusal->error.code == wire::kNotWellFormed) {
        return "not CBOR: " + refusal->error.message;
    }
    if (beginsLikeAReply(item)) {
        return std::string("not a reply as the protocol has them");
    }
    return formatted("not a request that the service would accept ({}): {}", refusal->error.code,
                     refusal->error.message);
}

std::string describeRest(const wire::FrameSplitter& frames) {
    if (frames.tooLong()) {
        return formatted("its length, {}, is beyond the longest, {}", frames.wanted() - wire::kLengthBytes,
                         wire::kMaximumFrameBytes);
    }
    return formatted("cut short: {} of {} bytes are there", frames.rest().size(), frames.wanted());
}

} // namespace

bool isHex(std::string_view text) {
    return bytesOfHex(text).has_value();
}

Decoded decodeFrames(std::string_view input) {
    const auto fromHex = bytesOfHex(input);
    const Bytes bytes =
        fromHex ? Bytes(*fromHex) : Bytes(reinterpret_cast<const std::uint8_t*>(input.data()), input.size());
    Decoded decoded;
    wire::FrameSplitter frames(bytes);
    std::size_t number = 1;
    for (auto item = frames.next(); item; item = frames.next(), ++number) {
        if (auto wrong = appendItem(decoded.text, *item)) {
            decoded.problems.push_back(formatted("frame {}: {}", number, *wrong));
        }
    }
    if (!frames.rest().empty()) {
        decoded.problems.push_back(formatted("frame {}: {}", number, describeRest(frames)));
    }
    return decoded;
}

} // namespace tamblo::tools
