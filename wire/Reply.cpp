#include "wire/Reply.h"

#include "base/Cbor.h"

namespace tamblo::wire {

namespace {

/// Everything of a reply up to its error.
void beginReply(CborWriter& writer, std::uint64_t id) {
    writer.arrayHead(4);
    writer.unsignedInteger(static_cast<std::uint64_t>(FrameKind::reply));
    writer.unsignedInteger(id);
}

template <typename WriteResult>
void appendReply(TextBuffer& out, std::uint64_t id, const WriteResult& writeResult) {
    const std::size_t start = beginFrame(out);
    CborWriter writer(out);
    beginReply(writer, id);
    writer.null();
    writeResult(writer);
    if (!finishFrame(out, start)) {
        appendErrorReply(out, id,
                         {std::string(kProtocolErrorDomain), kNotARequest, "the result is too long"});
    }
}

std::optional<Error> errorFrom(const Dictionary& dictionary) {
    const Value* domain = dictionary.find("domain");
    const Value* code = dictionary.find("code");
    if (domain == nullptr || code == nullptr || !domain->isString() || !code->isNumber()) {
        return std::nullopt;
    }
    Error error{std::string(domain->stringValue()), code->integerValue(), {}};
    if (const Value* message = dictionary.find("message")) {
        error.message = message->stringValue();
    }
    return error;
}

// Nearly every reply is `[1, id, null, null]` or has a boolean as its result: `84 01 (id) f6 (f4 to f6)`.
// These are written and read without the steps of a writer and a reader.
constexpr std::uint8_t kFalseItem = 0xF4;
constexpr std::uint8_t kTrueItem = 0xF5;
constexpr std::uint8_t kNullItem = 0xF6;

void appendPlainReply(TextBuffer& out, std::uint64_t id, std::uint8_t result) {
    constexpr std::size_t longest = 13;
    const std::size_t start = beginFrame(out);
    char* at = out.room(longest);
    const char* const begin = at;
    *at++ = '\x84';
    *at++ = '\x01';
    if (id < 24) {
        *at++ = static_cast<char>(id);
    } else {
        const unsigned power = id <= 0xFF ? 0 : id <= 0xFFFF ? 1 : id <= 0xFFFFFFFF ? 2 : 3;
        *at++ = static_cast<char>(24 + power);
        for (unsigned bits = 8U << power; bits != 0; bits -= 8) {
            *at++ = static_cast<char>(id >> (bits - 8));
        }
    }
    *at++ = static_cast<char>(kNullItem);
    *at++ = static_cast<char>(result);
    out.commit(static_cast<std::size_t>(at - begin));
    (void)finishFrame(out, start);
}

/// Nothing for any other.
std::optional<Reply> decodePlainReply(std::span<const std::uint8_t> item) noexcept {
    constexpr std::size_t shortest = 5;
    if (item.size() < shortest || item[0] != 0x84 || item[1] != 0x01 || item[item.size() - 2] != kNullItem ||
        item.back() < kFalseItem || item.back() > kNullItem) {
        return std::nullopt;
    }
    const auto idBytes = item.subspan(3, item.size() - shortest);
    std::uint64_t id = item[2];
    const std::size_t wanted = id < 24 ? 0 : std::size_t{1} << ((id - 24) % 8);
    if (id > 27 || idBytes.size() != wanted) {
        return std::nullopt;
    }
    if (wanted != 0) {
        id = 0;
        for (const std::uint8_t byte : idBytes) {
            id = id << 8 | byte;
        }
    }
    std::optional<Reply> reply(std::in_place);
    reply->id = id;
    if (item.back() != kNullItem) {
        reply->result.emplace(item.back() != kFalseItem);
    }
    return reply;
}

} // namespace

void appendNullReply(TextBuffer& out, std::uint64_t id) {
    appendPlainReply(out, id, kNullItem);
}

void appendBooleanReply(TextBuffer& out, std::uint64_t id, bool result) {
    appendPlainReply(out, id, result ? kTrueItem : kFalseItem);
}

void appendUnsignedReply(TextBuffer& out, std::uint64_t id, std::uint64_t result) {
    appendReply(out, id, [result](CborWriter& writer) { writer.unsignedInteger(result); });
}

void appendDictionaryReply(TextBuffer& out, std::uint64_t id, const Dictionary& result) {
    appendReply(out, id, [&result](CborWriter& writer) { writer.dictionary(result); });
}

void appendIntegersReply(TextBuffer& out, std::uint64_t id, std::span<const std::int64_t> result) {
    appendReply(out, id, [result](CborWriter& writer) {
        writer.arrayHead(result.size());
        for (const std::int64_t number : result) {
            writer.integer(number);
        }
    });
}

void appendErrorReply(TextBuffer& out, std::uint64_t id, const Error& error) {
    const std::size_t start = beginFrame(out);
    CborWriter writer(out);
    beginReply(writer, id);
    writer.mapHead(error.message.empty() ? 2 : 3);
    writer.text("domain");
    writer.text(error.domain);
    writer.text("code");
    writer.integer(error.code);
    if (!error.message.empty()) {
        writer.text("message");
        writer.text(error.message);
    }
    writer.null();
    (void)finishFrame(out, start);
}

std::optional<Reply> decodeReply(std::span<const std::uint8_t> item) {
    if (auto plain = decodePlainReply(item)) [[likely]] {
        return plain;
    }
    CborReader reader(item);
    auto array = reader.readArrayHead();
    const auto hasNext = [&] { return array && reader.moreElements(*array); };
    if (!hasNext() || reader.readUnsigned() != static_cast<std::uint64_t>(FrameKind::reply) || !hasNext()) {
        return std::nullopt;
    }
    const auto id = reader.readUnsigned();
    if (!id || !hasNext()) {
        return std::nullopt;
    }
    std::optional<Reply> reply(std::in_place);
    reply->id = *id;
    if (!reader.readNull()) {
        const auto dictionary = reader.readDictionary();
        reply->error = dictionary ? errorFrom(*dictionary) : std::nullopt;
        if (!reply->error) {
            return std::nullopt;
        }
    }
    if (!hasNext()) {
        return std::nullopt;
    }
    if (!reader.readNull()) {
        reply->result = reader.readValue();
        if (!reply->result) {
            return std::nullopt;
        }
    }
    if (hasNext() || reader.error() != CborError::none || !reader.atEnd()) {
        return std::nullopt;
    }
    return reply;
}

} // namespace tamblo::wire
