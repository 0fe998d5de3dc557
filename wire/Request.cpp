#include "wire/Request.h"

#include "wire/FrameScope.h"

#include <limits>

namespace tamblo::wire {

namespace {

/// The keys that the service adds to a payload: timestamp, its rejected predecessor, audio tag, application
/// name.
constexpr std::size_t kKeysYetToCome = 4;

class ParameterReader {
public:
    ParameterReader(CborReader& reader, CborReader::ArrayHead& array) noexcept
        : reader_(reader), array_(array) {}

    [[nodiscard]] bool next(std::string_view name) noexcept {
        missing_ = reader_.moreElements(array_) ? std::string_view() : name;
        return missing_.empty();
    }

    bool signedInteger(std::string_view name, std::int64_t& number) noexcept {
        if (!next(name)) {
            return false;
        }
        const auto read = reader_.readInteger();
        number = read.value_or(0);
        return read.has_value() || refuse(name, "a signed 64-bit integer");
    }

    template <typename Unsigned>
    bool unsignedInteger(std::string_view name, std::string_view wanted, Unsigned& number) noexcept {
        if (!next(name)) {
            return false;
        }
        const auto read = reader_.readUnsigned();
        if (!read || *read > std::numeric_limits<Unsigned>::max()) {
            return refuse(name, wanted);
        }
        number = static_cast<Unsigned>(*read);
        return true;
    }

    bool dictionary(std::string_view name, std::string_view wanted, Dictionary& dictionary) {
        if (!next(name)) {
            return false;
        }
        auto read = reader_.readDictionary(kKeysYetToCome);
        if (!read) {
            return refuse(name, wanted);
        }
        dictionary = std::move(*read);
        return true;
    }

    bool payload(Dictionary& dictionary) {
        if (reader_.nextIsNull() && next("payload")) {
            dictionary = Dictionary();
            return reader_.readNull();
        }
        return this->dictionary("payload", "a map or null", dictionary);
    }

    bool reporterIDs(std::vector<std::int64_t>& numbers) {
        numbers.clear();
        if (!next("reporter IDs")) {
            return false;
        }
        if (reader_.readNull()) {
            return true;
        }
        constexpr std::string_view wanted = "an array of signed 64-bit integers, or null";
        auto inner = reader_.readArrayHead();
        if (!inner) {
            return refuse("reporter IDs", wanted);
        }
        while (reader_.moreElements(*inner)) {
            const auto number = reader_.readInteger();
            if (!number) {
                return refuse("reporter IDs", wanted);
            }
            numbers.push_back(*number);
        }
        return reader_.error() == CborError::none || refuse("reporter IDs", wanted);
    }

    /// Whether all were read and none is left.
    [[nodiscard]] bool finish() noexcept {
        if (isWrong() || !missing_.empty()) {
            return false;
        }
        isLong_ = reader_.moreElements(array_);
        return !isLong_ && reader_.error() == CborError::none;
    }

    [[nodiscard]] std::string message(Method method) const {
        std::string text(methodName(method));
        if (isWrong()) {
            text.append(": ").append(wrong_).append(": wanted ").append(wanted_);
            if (reader_.error() != CborError::none) {
                text.append(", found ").append(describe(reader_.error()));
            }
            return text;
        }
        if (isLong_) {
            return text.append(": too many parameters");
        }
        return text.append(": too few parameters: ").append(missing_).append(" is missing");
    }

private:
    bool refuse(std::string_view name, std::string_view wanted) noexcept {
        wrong_ = name;
        wanted_ = wanted;
        return false;
    }
    [[nodiscard]] bool isWrong() const noexcept { return !wrong_.empty(); }

    CborReader& reader_;
    CborReader::ArrayHead& array_;
    std::string_view wrong_; ///< the parameter that was not read, and what it should have been
    std::string_view wanted_;
    std::string_view missing_; ///< the parameter at whose place the array ended
    bool isLong_ = false;
};

bool readParameters(ParameterReader& parameters, Request& request) {
    constexpr std::string_view sixteenBits = "an unsigned 16-bit integer";
    switch (request.method) {
    case Method::createReportingSession:
    case Method::getServiceNameForReporterID:
    case Method::startReportingSessionForID:
    case Method::stopReportingSessionForID:
    case Method::destroyReportingSession:
    case Method::reporterID:
        parameters.signedInteger("reporter ID", request.reporterID);
        break;
    case Method::setServiceType:
        parameters.unsignedInteger("type", sixteenBits, request.serviceType) &&
            parameters.signedInteger("reporter ID", request.reporterID);
        break;
    case Method::setConfiguration:
        parameters.dictionary("configuration", "a map", request.dictionary) &&
            parameters.signedInteger("reporter ID", request.reporterID);
        break;
    case Method::sendMessage:
        parameters.payload(request.dictionary) &&
            parameters.unsignedInteger("category", "an unsigned 32-bit integer", request.category) &&
            parameters.unsignedInteger("type", sixteenBits, request.type) &&
            parameters.reporterIDs(request.reporterIDs);
        break;
    case Method::getAllReporters:
    case Method::killService:
        break;
    }
    return parameters.finish();
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
    request.id.reset();
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

std::optional<Refusal> readRequest(CborReader& reader, Request& request) {
    request.id.reset();
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
                       std::string(methodName(request.method)) + ": params: wanted an array");
    }
    ParameterReader parameters(reader, *array);
    if (!readParameters(parameters, request)) {
        return refusal(request, kWrongParameters, parameters.message(request.method));
    }
    if (reader.moreElements(*frame)) {
        return refusal(request, kNotARequest, "the frame has too many elements");
    }
    return std::nullopt;
}

} // namespace

std::optional<Refusal> decodeRequest(std::span<const std::uint8_t> item, KeySetCache& keySets,
                                     Request& request) {
    CborReader reader(item, &keySets);
    std::optional<Refusal> refused = readRequest(reader, request);
    if (!refused && reader.error() == CborError::none && reader.atEnd()) [[likely]] {
        return std::nullopt;
    }
    if (auto notWellFormed = refuseUnlessWellFormed(item)) {
        return notWellFormed;
    }
    return refused;
}

bool appendRequestFrame(TextBuffer& out, const Request& request) {
    FrameScope frame(out);
    CborWriter writer(out);
    if (request.id) {
        writer.arrayHead(4);
        writer.unsignedInteger(static_cast<std::uint64_t>(FrameKind::request));
        writer.unsignedInteger(*request.id);
    } else {
        writer.arrayHead(3);
        writer.unsignedInteger(static_cast<std::uint64_t>(FrameKind::requestWithoutReply));
    }
    writer.text(methodName(request.method));
    switch (request.method) {
    case Method::setServiceType:
        writer.arrayHead(2);
        writer.unsignedInteger(request.serviceType);
        writer.integer(request.reporterID);
        break;
    case Method::setConfiguration:
        writer.arrayHead(2);
        writer.dictionary(request.dictionary);
        writer.integer(request.reporterID);
        break;
    case Method::sendMessage:
        writer.arrayHead(4);
        writer.dictionary(request.dictionary);
        writer.unsignedInteger(request.category);
        writer.unsignedInteger(request.type);
        writer.arrayHead(request.reporterIDs.size());
        for (const std::int64_t reporterID : request.reporterIDs) {
            writer.integer(reporterID);
        }
        break;
    case Method::getAllReporters:
    case Method::killService:
        writer.arrayHead(0);
        break;
    default:
        writer.arrayHead(1);
        writer.integer(request.reporterID);
        break;
    }
    return frame.finish();
}

} // namespace tamblo::wire
