#include "base/Json.h"

#include "base/Base64.h"
#include "base/KeySet.h"
#include "base/Rfc3339.h"

#include <algorithm>
#include <array>
#include <bit>
#include <charconv>
#include <cmath>
#include <cstdint>
#include <cstring>
#include <span>
#include <utility>

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

template <typename Word> Word load(const char* from) noexcept {
    Word word;
    std::memcpy(&word, from, sizeof word);
    return word;
}
template <typename Word> void store(char* to, Word word) noexcept {
    std::memcpy(to, &word, sizeof word);
}

/// Copies bytes up to the first that needs an escape, and answers how many. What is left of the last words is
/// taken with bytes that were copied before.
std::size_t copyPlain(char* to, std::string_view text) noexcept {
    const char* const from = text.data();
    const std::size_t size = text.size();
    std::size_t i = 0;
    for (; size - i >= 8; i += 8) {
        const auto block = load<std::uint64_t>(from + i);
        if (anyNeedsEscape(block)) {
            break;
        }
        store(to + i, block);
    }
    if (size >= 8 && size - i < 8) {
        const auto last = load<std::uint64_t>(from + size - 8);
        if (!anyNeedsEscape(last)) {
            store(to + size - 8, last);
            return size;
        }
    } else if (size >= 4 && i == 0 && size < 8) {
        const auto first = load<std::uint32_t>(from);
        const auto last = load<std::uint32_t>(from + size - 4);
        if (!anyNeedsEscape(std::uint64_t{first} << 32U | last)) {
            store(to, first);
            store(to + size - 4, last);
            return size;
        }
    }
    while (i < size && escapeOf(from[i]) == 0) {
        to[i] = from[i];
        ++i;
    }
    return i;
}

/// What a byte becomes in a text: copied as a whole, of which as many bytes count as `size` says.
struct Escaped {
    std::array<char, 7> text{};
    std::uint8_t size = 0;
};
constexpr std::size_t kLongestEscaped = 6;
constexpr std::array<Escaped, 256> kEscaped = [] {
    constexpr std::string_view hex = "0123456789abcdef";
    std::array<Escaped, 256> all{};
    for (std::size_t code = 0; code < all.size(); ++code) {
        const char escape = kEscapes[code];
        if (escape == 'u') {
            all[code] = {{'\\', 'u', '0', '0', hex[code >> 4U], hex[code & 0xFU]}, kLongestEscaped};
        } else if (escape != 0) {
            all[code] = {{'\\', escape}, 2};
        } else {
            all[code] = {{static_cast<char>(code)}, 1};
        }
    }
    return all;
}();

/// Needs room for eight bytes.
char* writeEscaped(char* to, char character) noexcept {
    const Escaped& escaped = kEscaped[static_cast<unsigned char>(character)];
    std::memcpy(to, &escaped, sizeof escaped);
    return to + escaped.size;
}

char* writeText(char* to, std::string_view text) noexcept {
    std::memcpy(to, text.data(), text.size());
    return to + text.size();
}

template <typename Number> char* writeNumber(char* to, Number number) noexcept {
    return std::to_chars(to, to + kScalarRoom, number).ptr;
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

/// Writes values on one line, or for people: a key or an element on a line of its own. It writes into the
/// room behind the text, whose length is set when this goes.
class Writer {
public:
    explicit Writer(TextBuffer& out, std::size_t indent = 0)
        : out_(out), indent_(indent), at_(out.room(kScalarRoom)), end_(out.data() + out.capacity()) {}
    ~Writer() { commit(); }
    Writer(const Writer&) = delete;
    Writer& operator=(const Writer&) = delete;

    void value(const Value& value) {
        switch (value.kind()) {
        case Value::Kind::string:
            return quoted(value.stringValue());
        case Value::Kind::data:
            return quoted(encodeBase64(value.dataValue()));
        case Value::Kind::array:
            return array(value.arrayValue());
        case Value::Kind::dictionary:
            return dictionary(value.dictionaryValue());
        default:
            reserve(kScalarRoom);
            at_ = writeScalar(at_, value);
        }
    }
    void dictionary(const Dictionary& dictionary) {
        open('{');
        for (std::size_t i = 0; i < dictionary.size(); ++i) {
            separate(i);
            member(dictionary, i);
        }
        close('}', dictionary.size());
    }
    /// One member of a dictionary on one line, with what separates it from the one before.
    void plainMember(const Dictionary& dictionary, std::size_t index) {
        reserve(1);
        *at_++ = index == 0 ? '{' : ',';
        member(dictionary, index);
    }
    void quoted(std::string_view text) {
        reserve(text.size() + 2);
        *at_++ = '"';
        std::size_t plain = copyPlain(at_, text);
        at_ += plain;
        while (plain != text.size()) {
            // Rare, but who wants it to cost much sends nothing else: some bytes at a time, in the room that
            // they can need at most.
            constexpr std::size_t kRun = 64;
            text.remove_prefix(plain);
            const std::string_view run = text.substr(0, kRun);
            text.remove_prefix(run.size());
            reserve(kLongestEscaped * run.size() + sizeof(Escaped) + text.size() + 1);
            for (const char character : run) {
                at_ = writeEscaped(at_, character);
            }
            plain = copyPlain(at_, text);
            at_ += plain;
        }
        *at_++ = '"';
    }
    void number(double number) {
        reserve(kScalarRoom);
        at_ = writeFloat(at_, number);
    }
    /// Bytes of the text as far as it is written.
    [[nodiscard]] std::size_t size() const noexcept { return static_cast<std::size_t>(at_ - out_.data()); }

    void open(char bracket) {
        reserve(1);
        *at_++ = bracket;
        depth_ += indent_;
    }
    void separate(std::size_t index) {
        reserve(1);
        *at_ = ',';
        at_ += index != 0 ? 1 : 0;
        startLine();
    }
    void close(char bracket, std::size_t count) {
        depth_ -= indent_;
        if (count != 0) {
            startLine();
        }
        reserve(1);
        *at_++ = bracket;
    }
    void plain(std::string_view text) {
        reserve(text.size());
        at_ = writeText(at_, text);
    }

private:
    void commit() noexcept { out_.commit(size() - out_.size()); }
    void reserve(std::size_t count) {
        if (static_cast<std::size_t>(end_ - at_) < count) [[unlikely]] {
            commit();
            at_ = out_.room(count);
            end_ = out_.data() + out_.capacity();
        }
    }

    void member(const Dictionary& dictionary, std::size_t index) {
        const std::string_view key = dictionary.keys().jsonKey(index);
        constexpr std::size_t kOrdinary = KeySet::kReadableOfJsonKey;
        reserve(std::max(key.size(), kOrdinary) + 1);
        // Nearly all are copied without asking how long they are.
        if (key.size() <= kOrdinary) {
            std::memcpy(at_, key.data(), kOrdinary);
            at_ += key.size();
        } else {
            at_ = writeText(at_, key);
        }
        if (indent_ != 0) {
            *at_++ = ' ';
        }
        value(dictionary.valueAt(index));
    }

    void array(std::span<const Value> elements) {
        open('[');
        for (std::size_t i = 0; i < elements.size(); ++i) {
            separate(i);
            value(elements[i]);
        }
        close(']', elements.size());
    }

    void startLine() {
        if (indent_ != 0) {
            reserve(1 + depth_);
            *at_++ = '\n';
            std::memset(at_, ' ', depth_);
            at_ += depth_;
        }
    }

    TextBuffer& out_;
    const std::size_t indent_; ///< spaces for each level; none for one line
    std::size_t depth_ = 0;
    char* at_;
    char* end_;
};

/// Whether JSON has a form for the value, as far as that is known without looking into it.
bool hasForm(const Value& value) noexcept {
    switch (value.kind()) {
    case Value::Kind::boolean:
    case Value::Kind::integer:
    case Value::Kind::unsignedInteger:
    case Value::Kind::string:
        return true;
    case Value::Kind::singleFloat:
        return std::isfinite(value.rawSingle());
    case Value::Kind::doubleFloat:
        return std::isfinite(value.rawDouble());
    default:
        return false;
    }
}

/// The kind of the first value in this one, which stands at `step`, that JSON has no form for, for people;
/// null without one. The way to it is put in front of `pointer`.
const char* kindWithoutForm(std::string_view step, const Value& value, std::string& pointer) {
    const char* kind = nullptr;
    switch (value.kind()) {
    case Value::Kind::date:
        kind = "a date";
        break;
    case Value::Kind::data:
        kind = "a byte string";
        break;
    case Value::Kind::singleFloat:
    case Value::Kind::doubleFloat:
        kind = hasForm(value) ? nullptr : "a number that is not finite";
        break;
    case Value::Kind::array:
        for (std::size_t i = 0; kind == nullptr && i < value.arrayValue().size(); ++i) {
            const Value& element = value.arrayValue()[i];
            kind = hasForm(element) ? nullptr : kindWithoutForm(std::to_string(i), element, pointer);
        }
        break;
    case Value::Kind::dictionary: {
        const Dictionary& dictionary = value.dictionaryValue();
        for (std::size_t i = 0; kind == nullptr && i < dictionary.size(); ++i) {
            const Value& field = dictionary.valueAt(i);
            kind = hasForm(field) ? nullptr : kindWithoutForm(dictionary.keyAt(i), field, pointer);
        }
        break;
    }
    default:
        break;
    }
    if (kind != nullptr) {
        std::string escaped = "/";
        for (const char character : step) {
            escaped += character == '~' ? "~0" : character == '/' ? "~1" : std::string(1, character);
        }
        pointer.insert(0, escaped);
    }
    return kind;
}

} // namespace

void appendJson(TextBuffer& out, const Value& value) {
    Writer(out).value(value);
}

void appendJsonObject(TextBuffer& out, const Dictionary& dictionary, std::vector<std::size_t>& members) {
    const std::size_t begin = out.size();
    members.resize(dictionary.size());
    Writer writer(out);
    for (std::size_t i = 0; i < members.size(); ++i) {
        members[i] = writer.size() + 1 - begin;
        writer.plainMember(dictionary, i);
    }
    writer.plain(members.empty() ? "{}" : "}");
}

void appendJsonObject(TextBuffer& out, const Dictionary& dictionary, std::vector<std::size_t>& members,
                      const JsonObjectText& before) {
    const std::size_t begin = out.size();
    const std::span<const Value> values = dictionary.values();
    const std::span<const Value> valuesBefore = before.dictionary.values();
    const std::size_t count = values.size();
    members.resize(count);
    Writer writer(out);
    for (std::size_t i = 0; i < count;) {
        std::size_t end = i;
        // May wrap around: it is added to what is as far ahead.
        const std::size_t shift = writer.size() + 1 - begin - before.members[i];
        for (; end < count && values[end].isSame(valuesBefore[end]); ++end) {
            members[end] = before.members[end] + shift;
        }
        if (end != i) {
            const std::size_t from = before.members[i] - 1;
            const std::size_t to = end < count ? before.members[end] - 1 : before.text.size() - 1;
            writer.plain(before.text.substr(from, to - from));
            i = end;
            continue;
        }
        members[i] = writer.size() + 1 - begin;
        writer.plainMember(dictionary, i);
        ++i;
    }
    writer.plain(count == 0 ? "{}" : "}");
}

std::optional<std::string> appendPrettyJson(TextBuffer& out, std::string_view key,
                                            const Dictionary& dictionary) {
    const Value value(dictionary);
    std::string pointer;
    if (const char* const kind = kindWithoutForm(key, value, pointer)) {
        return std::string(kind) + " has no JSON form, at " + pointer;
    }
    constexpr std::size_t indent = 2;
    Writer writer(out, indent);
    writer.open('{');
    writer.separate(0);
    writer.quoted(key);
    writer.plain(": ");
    writer.value(value);
    writer.close('}', 1);
    return std::nullopt;
}

void appendJsonString(TextBuffer& out, std::string_view text) {
    Writer(out).quoted(text);
}

void appendJsonNumber(TextBuffer& out, double number) {
    Writer(out).number(number);
}

std::string jsonText(const Value& value) {
    TextBuffer out;
    appendJson(out, value);
    return std::string(out.view());
}

} // namespace tamblo
