#include "wire/Request.h"

#include "base/Format.h"

#include <limits>
#include <string>

namespace tamblo::wire {

namespace {

/// Room in a message for the keys that nearly every one lacks: audio tag, application name.
constexpr std::size_t kSpareKeys = 2;

constexpr std::size_t kIdBytes = 8;

void storeId(char* to, std::uint64_t id) noexcept {
    for (std::size_t i = 0; i < kIdBytes; ++i) {
        to[i] = static_cast<char>(id >> (8 * (kIdBytes - 1 - i)));
    }
}

Refusal refusal(const Request& request, std::int64_t code, std::string message) {
    return {.id = request.id.value_or(0),
            .endsConnection = code == kNotWellFormed,
            .error = {std::string(kProtocolErrorDomain), code, std::move(message)}};
}

/// Bytes that are not one CBOR item come before every other fault, and are looked for only once there is one.
std::optional<Refusal> refuseUnlessWellFormed(std::span<const std::uint8_t> item) {
    CborReader reader(item);
    if (reader.skip() && reader.atEnd()) {
        return std::nullopt;
    }
    const std::string_view what =
        reader.error() == CborError::none ? "bytes follow the item" : describe(reader.error());
    return refusal(Request{}, kNotWellFormed, std::string(what));
}

/// Reads `0, id, method` or `2, method`. The answer says what is wrong.
std::optional<Refusal> readHead(CborReader& reader, CborReader::ArrayHead& frame, Request& request) {
    const auto kind = reader.moreElements(frame) ? reader.readUnsigned() : std::nullopt;
    const bool isRequest = kind == static_cast<std::uint64_t>(FrameKind::request);
    if (!isRequest && kind != static_cast<std::uint64_t>(FrameKind::requestWithoutReply)) {
        return refusal(request, kNotARequest, "the frame's first element is neither 0 nor 2");
    }
    if (isRequest) {
        request.id = reader.moreElements(frame) ? reader.readUnsigned() : std::nullopt;
        if (!request.id) {
            return refusal(request, kNotARequest, "the request's id is not an unsigned integer");
        }
    }
    if (!reader.moreElements(frame) || reader.peek() != CborReader::Type::text) {
        return refusal(request, kNotARequest, "the request's method is not a text");
    }
    std::optional<std::string_view> name = reader.readText();
    std::optional<Value> assembled;
    if (!name) {
        assembled = reader.readValue();
        if (!assembled) {
            return refusal(request, kNotARequest, "the request's method is not a text");
        }
        name = assembled->stringValue();
    }
    const auto method = methodNamed(*name);
    if (!method) {
        constexpr std::size_t longestQuoted = 64;
        return refusal(request, kUnknownMethod,
                       name->size() > longestQuoted ? "unknown method"
                                                    : "unknown method " + std::string(*name));
    }
    request.method = *method;
    return std::nullopt;
}

template <typename Unsigned> bool readUnsigned(CborReader& reader, Unsigned& number) noexcept {
    const auto read = reader.readUnsigned();
    number = static_cast<Unsigned>(read.value_or(0));
    return read.has_value() && *read <= std::numeric_limits<Unsigned>::max();
}

/// Keeps one more than allowed at most: the caller sees that there are too many.
bool readReporterIDs(CborReader& reader, std::size_t atMost, std::vector<std::int64_t>& numbers) {
    numbers.clear();
    if (reader.readNull()) {
        return true;
    }
    auto array = reader.readArrayHead();
    while (array && reader.moreElements(*array)) {
        const auto number = reader.readInteger();
        if (!number) {
            return false;
        }
        if (numbers.size() <= atMost) {
            numbers.push_back(*number);
        }
    }
    return array && reader.error() == CborError::none;
}

bool readDictionary(CborReader& reader, Dictionary& dictionary) {
    auto read = reader.readDictionary(kSpareKeys);
    if (read) {
        dictionary = std::move(*read);
    }
    return read.has_value();
}

bool readParameter(CborReader& reader, Parameter parameter, const RequestLimits& limits, Request& request) {
    switch (parameter) {
    case Parameter::none:
        break;
    case Parameter::payload:
        if (reader.nextIsNull()) {
            request.dictionary = Dictionary();
            return reader.readNull();
        }
        return readDictionary(reader, request.dictionary);
    case Parameter::configuration:
        return readDictionary(reader, request.dictionary);
    case Parameter::category:
        return readUnsigned(reader, request.category);
    case Parameter::type:
        return readUnsigned(reader, request.type);
    case Parameter::serviceType:
        return readUnsigned(reader, request.serviceType);
    case Parameter::reporterID: {
        const auto number = reader.readInteger();
        request.reporterID = number.value_or(0);
        return number.has_value();
    }
    case Parameter::reporterIDs:
        return readReporterIDs(reader, limits.reportersOfMessage, request.reporterIDs);
    }
    return false;
}

/// The limit that stopped the reader, or that the request is beyond.
std::optional<Error> limitReachedBy(const CborReader& reader, const RequestLimits& limits,
                                    const Request& request) {
    switch (reader.error()) {
    case CborError::tooManyEntries:
        return limitReached("entries_of_dictionary", limits.values.entries);
    case CborError::keyTooLong:
        return limitReached("key_bytes", limits.values.keyBytes);
    case CborError::keysTooLong:
        return limitReached("bytes_of_keys", limits.values.bytesOfKeys);
    case CborError::tooLarge:
        return limitReached("decoded_bytes_of_frame", limits.values.decodedBytes);
    default:
        break;
    }
    if (request.reporterIDs.size() > limits.reportersOfMessage) {
        return limitReached("reporters_of_message", limits.reportersOfMessage);
    }
    if (request.reporterIDs.size() > 1 &&
        reader.decodedBytes() > limits.deliveredBytesOfMessage / request.reporterIDs.size()) {
        return limitReached("delivered_bytes_of_message", limits.deliveredBytesOfMessage);
    }
    return std::nullopt;
}

std::optional<Refusal> readParameters(CborReader& reader, CborReader::ArrayHead& array,
                                      const RequestLimits& limits, Request& request) {
    const MethodRow& method = rowOf(request.method);
    for (const Parameter parameter : parametersOf(request.method)) {
        const auto& [name, wanted] = kParameters[static_cast<std::size_t>(parameter)];
        if (!reader.moreElements(array)) {
            return refusal(request, kWrongParameters,
                           formatted("{}: too few parameters: {} is missing", method.name, name));
        }
        if (!readParameter(reader, parameter, limits, request)) {
            if (auto reached = limitReachedBy(reader, limits, request)) {
                return Refusal{.id = request.id.value_or(0), .error = *std::move(reached)};
            }
            const bool isNoValue = reader.error() != CborError::none;
            return refusal(request, kWrongParameters,
                           formatted("{}: {}: wanted {}{}{}", method.name, name, wanted,
                                     isNoValue ? ", found " : "", isNoValue ? describe(reader.error()) : ""));
        }
    }
    if (reader.moreElements(array)) {
        return refusal(request, kWrongParameters, formatted("{}: too many parameters", method.name));
    }
    if (auto reached = limitReachedBy(reader, limits, request)) {
        return Refusal{.id = request.id.value_or(0), .error = *std::move(reached)};
    }
    return std::nullopt;
}

std::optional<Refusal> readRequest(CborReader& reader, const RequestLimits& limits, Request& request) {
    request.id.reset();
    request.reporterIDs.clear();
    auto frame = reader.readArrayHead();
    if (!frame) {
        return refusal(request, kNotARequest, "the frame is not an array");
    }
    if (auto refused = readHead(reader, *frame, request)) {
        return refused;
    }
    auto array = reader.moreElements(*frame) ? reader.readArrayHead() : std::nullopt;
    if (!array) {
        return refusal(request, kWrongParameters,
                       formatted("{}: params: wanted an array", rowOf(request.method).name));
    }
    if (auto refused = readParameters(reader, *array, limits, request)) {
        return refused;
    }
    if (reader.moreElements(*frame)) {
        return refusal(request, kNotARequest, "the frame has too many elements");
    }
    return std::nullopt;
}

/// Up to its payload, nearly every request is this, byte for byte: `[0, id, "sendMessage", [` with the id in
/// its longest form, as the client library writes it.
constexpr std::string_view kMessageBegin("\x84\0\x1B", 3);
constexpr std::string_view kMessageMethod = "\x6BsendMessage\x84";
constexpr std::size_t kMethodBytes = kMessageMethod.size() - 2; ///< of its name
constexpr std::size_t kMessageHeadBytes = kMessageBegin.size() + kIdBytes + kMessageMethod.size();

/// Whether it is; then the request's id and method are set.
bool beginsMessage(std::span<const std::uint8_t> item, Request& request) noexcept {
    if (item.size() < kMessageHeadBytes) {
        return false;
    }
    const std::string_view head(reinterpret_cast<const char*>(item.data()), kMessageHeadBytes);
    if (!head.starts_with(kMessageBegin) || !head.ends_with(kMessageMethod)) {
        return false;
    }
    std::uint64_t id = 0;
    for (const std::uint8_t byte : item.subspan(kMessageBegin.size(), kIdBytes)) {
        id = id << 8U | byte;
    }
    request.id = id;
    request.method = Method::sendMessage;
    return true;
}

/// Reads the rest of a message from its payload on.
std::optional<Refusal> readMessage(CborReader& reader, const RequestLimits& limits, Request& request) {
    request.reporterIDs.clear();
    CborReader::ArrayHead parameters{.count = 4};
    return readParameters(reader, parameters, limits, request);
}

} // namespace

std::optional<Refusal> decodeRequest(std::span<const std::uint8_t> item, KeySetCache& keySets,
                                     Request& request, const RequestLimits& limits) {
    const bool isMessage = beginsMessage(item, request);
    CborReader reader(isMessage ? item.subspan(kMessageHeadBytes) : item, &keySets, limits.values,
                      isMessage ? kMethodBytes : 0);
    std::optional<Refusal> refused =
        isMessage ? readMessage(reader, limits, request) : readRequest(reader, limits, request);
    request.decodedBytes = reader.decodedBytes();
    if (!refused && reader.error() == CborError::none && reader.atEnd()) [[likely]] {
        return std::nullopt;
    }
    if (auto notWellFormed = refuseUnlessWellFormed(item)) {
        return notWellFormed;
    }
    return refused;
}

std::size_t beginRequest(TextBuffer& out, Method method, std::optional<std::uint64_t> id) {
    const std::size_t start = beginFrame(out);
    CborWriter writer(out);
    writer.arrayHead(id ? 4 : 3);
    writer.unsignedInteger(
        static_cast<std::uint64_t>(id ? FrameKind::request : FrameKind::requestWithoutReply));
    if (id) {
        // The head that says the longest number, whose bytes replaceId can overwrite.
        writer.unsignedInteger(std::numeric_limits<std::uint64_t>::max());
        storeId(out.data() + out.size() - kIdBytes, *id);
    }
    writer.text(rowOf(method).name);
    writer.arrayHead(parametersOf(method).size());
    return start;
}

void replaceId(TextBuffer& frame, std::uint64_t id) noexcept {
    // Behind the length, the array's head, the kind and the number's own head.
    storeId(frame.data() + kLengthBytes + 3, id);
}

} // namespace tamblo::wire
