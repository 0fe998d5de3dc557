#include "base/Json.h"

#include "base/Base64.h"
#include "base/Rfc3339.h"

#include <array>
#include <bit>
#include <charconv>
#include <cmath>
#include <cstdint>
#include <cstring>

namespace tamblo {

namespace {

/// Enough for every number, literal and date, a `.0` included.
constexpr std::size_t kScalarRoom = 40;

/// 0 for a byte that stands for itself, `u` for one that has no short escape, otherwise its short escape.
constexpr std::array<char, 256> kEscapes = [] {
    std::array<char, 256> escapes{};
    for (std::size_t control = 0; control < 0x20; ++control) {
        escapes[control] = 'u';
    }
    escapes['\b'] = 'b';
    escapes['\f'] = 'f';
    escapes['\n'] = 'n';
    escapes['\r'] = 'r';
    escapes['\t'] = 't';
    escapes['"'] = '"';
    escapes['\\'] = '\\';
    return escapes;
}();

char escapeOf(char character) noexcept {
    return kEscapes[static_cast<unsigned char>(character)];
}

/// Whether one of the eight bytes needs an escape: each test sets the high bit of the bytes that it finds,
/// and may do so for others only next to one that it found.
bool anyNeedsEscape(std::uint64_t block) noexcept {
    constexpr std::uint64_t ones = 0x0101'0101'0101'0101;
    constexpr std::uint64_t highBits = ones * 0x80;
    const std::uint64_t quote = block ^ (ones * '"');
    const std::uint64_t backslash = block ^ (ones * '\\');
    const std::uint64_t found =
        ((block - ones * 0x20) & ~block) | ((quote - ones) & ~quote) | ((backslash - ones) & ~backslash);
    return (found & highBits) != 0;
}

/// Copies bytes up to the first that needs an escape, and answers how many.
std::size_t copyPlain(char* to, std::string_view text) noexcept {
    std::size_t i = 0;
    while (text.size() - i >= 8) {
        std::uint64_t block;
        std::memcpy(&block, text.data() + i, sizeof block);
        if (anyNeedsEscape(block)) {
            break;
        }
        std::memcpy(to + i, &block, sizeof block);
        i += 8;
    }
    while (i < text.size() && escapeOf(text[i]) == 0) {
        to[i] = text[i];
        ++i;
    }
    return i;
}

char* writeEscaped(char* to, char character) noexcept {
    constexpr std::string_view hex = "0123456789abcdef";
    *to++ = '\\';
    *to++ = escapeOf(character);
    if (to[-1] == 'u') {
        const auto code = static_cast<unsigned char>(character);
        *to++ = '0';
        *to++ = '0';
        *to++ = hex[code >> 4U];
        *to++ = hex[code & 0xFU];
    }
    return to;
}

char* writeText(char* to, std::string_view text) noexcept {
    std::memcpy(to, text.data(), text.size());
    return to + text.size();
}

template <typename Number> char* writeNumber(char* to, Number number) noexcept {
    return std::to_chars(to, to + kScalarRoom, number).ptr;
}

/// Writes a number of few decimals, as most measurements are, without the general algorithm; nothing for
/// others. Among the decimals of as few digits as the type holds exactly, no two read as the same number: the
/// one that reads back is therefore the shortest.
template <typename Float> char* writeShortDecimal(char* to, Float number) noexcept {
    constexpr bool isSingle = std::is_same_v<Float, float>;
    constexpr std::uint32_t scale = isSingle ? 1'000 : 1'000'000;
    constexpr Float limit = isSingle ? Float(1e3) : Float(1e9);
    const Float magnitude = std::abs(number);
    if (!(magnitude >= Float(1e-3) && magnitude < limit)) {
        return nullptr;
    }
    const auto scaled = static_cast<std::uint64_t>(magnitude * Float(scale) + Float(0.5));
    auto fraction = static_cast<std::uint32_t>(scaled % scale);
    if (static_cast<Float>(scaled) / Float(scale) != magnitude || fraction == 0) {
        return nullptr;
    }
    if (number < 0) {
        *to++ = '-';
    }
    to = writeNumber(to, static_cast<std::uint32_t>(scaled / scale));
    *to++ = '.';
    std::size_t digits = isSingle ? 3 : 6;
    for (; fraction % 10 == 0; fraction /= 10) {
        --digits;
    }
    for (std::size_t i = digits; i > 0; fraction /= 10) {
        to[--i] = static_cast<char>('0' + fraction % 10);
    }
    return to + digits;
}

/// The shortest text of a number with a fraction, in exact fixed-point arithmetic: its digits, up to the
/// first place at which the decimal below or the one above what is left is nearer to the number than any
/// other number is (G. Steele, J. White: "How to Print Floating-Point Numbers Accurately", 1990). Nothing for
/// numbers that are whole, small or large, for powers of two (their neighbours are not equally far) and for a
/// tie.
char* writeFraction(char* to, double number) noexcept {
    constexpr unsigned kStoredBits = 52;
    constexpr int kMostFractionBits = 59; // leaves room for ten times twice the fraction
    constexpr std::uint64_t kHiddenBit = std::uint64_t{1} << kStoredBits;
    const auto bits = std::bit_cast<std::uint64_t>(number);
    const int fractionBits = 1075 - static_cast<int>(bits >> kStoredBits & 0x7FFU);
    const std::uint64_t stored = bits & (kHiddenBit - 1);
    if (fractionBits <= 0 || fractionBits > kMostFractionBits || stored == 0) {
        return nullptr;
    }
    const std::uint64_t significand = stored | kHiddenBit;
    if (number < 0) {
        *to++ = '-';
    }
    to = writeNumber(to, significand >> fractionBits);
    *to++ = '.';
    // In units of half of the significand's last place, which is how far the number's own decimals reach;
    // those at the end of the reach are read as the number when its significand is even.
    const auto unitBits = static_cast<unsigned>(fractionBits) + 1;
    const std::uint64_t one = std::uint64_t{1} << unitBits;
    const std::uint64_t end = significand % 2 == 0 ? 1 : 0;
    std::uint64_t rest = significand * 2 & (one - 1);
    for (std::uint64_t reach = 10;; reach *= 10) {
        rest *= 10;
        const auto digit = static_cast<char>('0' + (rest >> unitBits));
        rest &= one - 1;
        const bool below = rest < reach + end;
        const bool above = rest + reach + end > one;
        if (!below && !above) {
            *to++ = digit;
            continue;
        }
        if (below && above && rest == one / 2) {
            return nullptr;
        }
        const bool roundsUp = above && (!below || rest > one / 2);
        *to++ = static_cast<char>(digit + (roundsUp ? 1 : 0)); // never past 9: it would have ended before
        return to;
    }
}

template <typename Float> char* writeFloat(char* to, Float number) noexcept {
    // Below this every whole number is its own shortest text.
    constexpr Float integral = std::is_same_v<Float, float> ? Float(1U << 24U) : Float(1ULL << 53U);
    if (number > -integral && number < integral) {
        const auto whole = static_cast<std::int64_t>(number);
        if (static_cast<Float>(whole) == number && !(whole == 0 && std::signbit(number))) {
            return writeText(writeNumber(to, whole), ".0");
        }
    } else if (!std::isfinite(number)) {
        return writeText(to, "null");
    }
    if constexpr (std::is_same_v<Float, double>) {
        if (char* const end = writeFraction(to, number)) {
            return end;
        }
    }
    if (char* const end = writeShortDecimal(to, number)) {
        return end;
    }
    char* const end = writeNumber(to, number);
    const std::string_view text(to, static_cast<std::size_t>(end - to));
    return text.find_first_of(".e") == std::string_view::npos ? writeText(end, ".0") : end;
}

char* writeDate(char* to, double seconds) {
    const auto text = formatRfc3339(seconds);
    if (!text) {
        return writeText(to, "null");
    }
    *to++ = '"';
    to = writeText(to, *text);
    *to++ = '"';
    return to;
}

char* writeScalar(char* to, const Value& value) {
    switch (value.kind()) {
    case Value::Kind::boolean:
        return value.rawInteger() != 0 ? writeText(to, "true") : writeText(to, "false");
    case Value::Kind::integer:
        return writeNumber(to, value.rawInteger());
    case Value::Kind::unsignedInteger:
        return writeNumber(to, value.rawUnsigned());
    case Value::Kind::singleFloat:
        return writeFloat(to, value.rawSingle());
    case Value::Kind::doubleFloat:
        return writeFloat(to, value.rawDouble());
    default:
        return writeDate(to, value.dateSeconds());
    }
}

void appendArray(TextBuffer& out, std::span<const Value> elements);

/// Appends a text behind a lead-in (a separator, a key).
void appendQuoted(TextBuffer& out, std::string_view lead, std::string_view text) {
    char* const begin = out.room(lead.size() + text.size() + 2);
    char* at = writeText(begin, lead);
    *at++ = '"';
    std::size_t plain = copyPlain(at, text);
    at += plain;
    while (plain != text.size()) {
        // Rare: from here on each step asks for the most room that it can need.
        out.commit(static_cast<std::size_t>(at - out.data()) - out.size());
        text.remove_prefix(plain);
        at = writeEscaped(out.room(text.size() + 8), text.front());
        text.remove_prefix(1);
        plain = copyPlain(at, text);
        at += plain;
    }
    *at++ = '"';
    out.commit(static_cast<std::size_t>(at - out.data()) - out.size());
}

void appendItem(TextBuffer& out, std::string_view lead, const Value& value) {
    switch (value.kind()) {
    case Value::Kind::string:
        return appendQuoted(out, lead, value.stringValue());
    case Value::Kind::data:
        return appendQuoted(out, lead, encodeBase64(value.dataValue()));
    case Value::Kind::array:
        out.append(lead);
        return appendArray(out, value.arrayValue());
    case Value::Kind::dictionary:
        out.append(lead);
        return appendJson(out, value.dictionaryValue());
    default:
        break;
    }
    char* const begin = out.room(lead.size() + kScalarRoom);
    char* const end = writeScalar(writeText(begin, lead), value);
    out.commit(static_cast<std::size_t>(end - begin));
}

void appendArray(TextBuffer& out, std::span<const Value> elements) {
    out.append('[');
    std::string_view separator = "";
    for (const Value& element : elements) {
        appendItem(out, separator, element);
        separator = ",";
    }
    out.append(']');
}

template <typename Item> std::string textOf(const Item& item) {
    TextBuffer out;
    appendJson(out, item);
    return std::string(out.view());
}

} // namespace

void appendJson(TextBuffer& out, const Value& value) {
    appendItem(out, "", value);
}

void appendJson(TextBuffer& out, const Dictionary& dictionary) {
    const KeySet& keys = dictionary.keys();
    const std::span<const Value> values = dictionary.values();
    out.append('{');
    for (std::size_t i = 0; i < values.size(); ++i) {
        if (i != 0) {
            out.append(',');
        }
        appendItem(out, keys.jsonKey(i), values[i]);
    }
    out.append('}');
}

void appendJsonString(TextBuffer& out, std::string_view text) {
    appendQuoted(out, "", text);
}

void appendJsonNumber(TextBuffer& out, double number) {
    char* const begin = out.room(kScalarRoom);
    out.commit(static_cast<std::size_t>(writeFloat(begin, number) - begin));
}

std::string jsonText(const Value& value) {
    return textOf(value);
}

std::string jsonText(const Dictionary& dictionary) {
    return textOf(dictionary);
}

} // namespace tamblo
