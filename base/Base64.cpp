#include "base/Base64.h"

#include <array>

namespace tamblo {

namespace {

constexpr std::string_view kAlphabet = "ABCDEFGHIJKLMNOPQRSTUVWXYZabcdefghijklmnopqrstuvwxyz0123456789+/";
constexpr std::uint8_t kNoDigit = 0xFF;

constexpr std::array<std::uint8_t, 256> kDigits = [] {
    std::array<std::uint8_t, 256> digits{};
    digits.fill(kNoDigit);
    for (std::size_t i = 0; i < kAlphabet.size(); ++i) {
        digits[static_cast<unsigned char>(kAlphabet[i])] = static_cast<std::uint8_t>(i);
    }
    return digits;
}();

std::uint8_t digitOf(char character) noexcept {
    return kDigits[static_cast<unsigned char>(character)];
}

char characterFor(std::uint32_t group, unsigned shift) noexcept {
    return kAlphabet[(group >> shift) & 0x3FU];
}

} // namespace

std::string encodeBase64(std::span<const std::uint8_t> bytes) {
    std::string text;
    text.reserve((bytes.size() + 2) / 3 * 4);
    std::size_t i = 0;
    for (; i + 3 <= bytes.size(); i += 3) {
        const std::uint32_t group = static_cast<std::uint32_t>(bytes[i]) << 16U |
                                    static_cast<std::uint32_t>(bytes[i + 1]) << 8U | bytes[i + 2];
        for (const unsigned shift : {18U, 12U, 6U, 0U}) {
            text += characterFor(group, shift);
        }
    }
    if (const std::size_t left = bytes.size() - i; left != 0) {
        const std::uint32_t second = left == 2 ? bytes[i + 1] : 0;
        const std::uint32_t group = static_cast<std::uint32_t>(bytes[i]) << 16U | second << 8U;
        text += characterFor(group, 18);
        text += characterFor(group, 12);
        text += left == 2 ? characterFor(group, 6) : '=';
        text += '=';
    }
    return text;
}

std::optional<std::vector<std::uint8_t>> decodeBase64(std::string_view text) {
    if (text.size() % 4 != 0) {
        return std::nullopt;
    }
    const std::size_t padding = text.ends_with("==") ? 2 : text.ends_with('=') ? 1 : 0;
    text.remove_suffix(padding);

    std::vector<std::uint8_t> bytes;
    bytes.reserve(text.size() * 3 / 4);
    std::uint32_t pending = 0;
    unsigned pendingBits = 0;
    for (const char character : text) {
        const std::uint8_t digit = digitOf(character);
        if (digit == kNoDigit) {
            return std::nullopt;
        }
        pending = pending << 6U | digit;
        pendingBits += 6;
        if (pendingBits >= 8) {
            pendingBits -= 8;
            bytes.push_back(static_cast<std::uint8_t>(pending >> pendingBits));
            pending &= (1U << pendingBits) - 1;
        }
    }
    // Bits left over must be 0, so that every run of bytes has one text only.
    if (pending != 0) {
        return std::nullopt;
    }
    return bytes;
}

} // namespace tamblo
