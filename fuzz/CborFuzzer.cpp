#include "base/Cbor.h"
#include "base/Json.h"

#include <cstddef>
#include <cstdint>
#include <cstdlib>
#include <optional>
#include <span>
#include <string>

namespace tamblo {
namespace {

using Bytes = std::span<const std::uint8_t>;

void require(bool holds) {
    if (!holds) {
        std::abort();
    }
}

/// Whether one well-formed item begins at `at`, which is moved behind it: the rules of RFC 8949, appendix C,
/// once more and in another way than the reader has them. A depth beyond any that matters here counts as
/// malformed.
bool isWellFormed(Bytes bytes, std::size_t& at, int depth, std::uint8_t chunksOf = 0xFF) {
    if (at == bytes.size()) {
        return false;
    }
    const std::uint8_t initial = bytes[at++];
    const auto major = static_cast<std::uint8_t>(initial >> 5U);
    const auto info = static_cast<std::uint8_t>(initial & 0x1FU);
    if (chunksOf != 0xFF && (major != chunksOf || info == 31)) {
        return false;
    }
    std::uint64_t argument = info;
    if (info >= 24 && info <= 27) {
        argument = 0;
        for (unsigned left = 1U << (info - 24U); left > 0; --left) {
            if (at == bytes.size()) {
                return false;
            }
            argument = argument << 8U | bytes[at++];
        }
    }
    const bool indefinite = info == 31 && major >= 2 && major <= 5;
    if (depth == 0 || (info > 27 && !indefinite) || (initial == 0xF8 && argument < 32)) {
        return false;
    }
    const auto atBreak = [&] { return at < bytes.size() && bytes[at] == 0xFF && ++at != 0; };
    const auto isText = [](std::uint8_t type) { return type == 2 || type == 3; };
    if (isText(major) && !indefinite) {
        const bool fits = argument <= bytes.size() - at;
        at += fits ? static_cast<std::size_t>(argument) : 0;
        return fits;
    }
    const int items = major == 5 ? 2 : 1;
    const std::uint64_t count = major == 6 ? 1 : major == 4 || major == 5 ? argument : 0;
    for (std::uint64_t i = 0; indefinite ? !atBreak() : i < count; ++i) {
        for (int item = 0; item < items; ++item) {
            if (!isWellFormed(bytes, at, depth - 1, isText(major) ? major : 0xFF)) {
                return false;
            }
        }
    }
    return true;
}

bool saysNotWellFormed(CborError error) {
    return error == CborError::truncated || error == CborError::malformed;
}

std::optional<Value> readAll(CborReader& reader) {
    auto value = reader.readValue();
    require(value.has_value() == (reader.error() == CborError::none));
    require(value || reader.peek() == CborReader::Type::end);
    return value;
}

/// The cached and the plain reader agree; what was read and is written again reads back equal and is written
/// as the same bytes; `skip` accepts what is well-formed and nothing else, and steps exactly over it.
void checkCbor(Bytes bytes) {
    static KeySetCache cache;
    CborReader plain(bytes);
    CborReader cached(bytes, &cache);
    const auto value = readAll(plain);
    require(readAll(cached) == value && plain.error() == cached.error());

    constexpr int depth = 2000;
    std::size_t length = 0;
    const bool wellFormed = isWellFormed(bytes, length, depth);
    CborReader whole(bytes);
    const bool skipped = whole.skip();
    require(!wellFormed || skipped);
    require(wellFormed || !skipped || bytes.size() > depth);
    require(skipped || saysNotWellFormed(whole.error()));
    require(!skipped || !saysNotWellFormed(plain.error()));
    if (wellFormed) {
        require(CborReader(bytes.first(length)).skip());
        require(length == 0 || !CborReader(bytes.first(length - 1)).skip());
    }
    if (!value) {
        return;
    }
    require(skipped && wellFormed);
    TextBuffer written;
    CborWriter(written).value(*value);
    CborReader again(written.bytes(), &cache);
    const auto reread = readAll(again);
    require(reread == value && again.atEnd());
    TextBuffer rewritten;
    CborWriter(rewritten).value(*reread);
    require(rewritten.view() == written.view());
    require(std::holds_alternative<Value>(readJson(jsonText(*value))) || jsonText(*value) == "null");
}

} // namespace
} // namespace tamblo

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* bytes, std::size_t size) {
    tamblo::checkCbor({bytes, size});
    return 0;
}
