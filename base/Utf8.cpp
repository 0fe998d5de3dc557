#include "base/Utf8.h"

#include <cstdint>
#include <cstring>

namespace tamblo {

namespace {

using Byte = unsigned char;

/// The length of the well-formed sequence at `at`, which begins with a byte above ASCII; 0 when there is
/// none.
std::size_t sequenceLength(const Byte* at, std::size_t available) noexcept {
    const Byte lead = at[0];
    if (lead < 0xC2 || lead > 0xF4) {
        return 0;
    }
    const std::size_t length = lead < 0xE0 ? 2 : lead < 0xF0 ? 3 : 4;
    if (available < length) {
        return 0;
    }
    // The second byte's range is narrower after four of the leads: that is what keeps out overlong forms,
    // surrogates and what lies above U+10FFFF.
    const Byte least = lead == 0xE0 ? 0xA0 : lead == 0xF0 ? 0x90 : 0x80;
    const Byte most = lead == 0xED ? 0x9F : lead == 0xF4 ? 0x8F : 0xBF;
    if (at[1] < least || at[1] > most) {
        return 0;
    }
    for (std::size_t i = 2; i < length; ++i) {
        if (!isUtf8Continuation(static_cast<char>(at[i]))) {
            return 0;
        }
    }
    return length;
}

} // namespace

bool isUtf8(std::string_view text) noexcept {
    constexpr std::uint64_t highBits = 0x8080'8080'8080'8080;
    const auto* at = reinterpret_cast<const Byte*>(text.data());
    const auto* const end = at + text.size();
    while (at != end) {
        while (end - at >= 8) {
            std::uint64_t block;
            std::memcpy(&block, at, sizeof block);
            if ((block & highBits) != 0) {
                break;
            }
            at += 8;
        }
        while (at != end && *at < 0x80) {
            ++at;
        }
        while (at != end && *at >= 0x80) {
            const std::size_t length = sequenceLength(at, static_cast<std::size_t>(end - at));
            if (length == 0) {
                return false;
            }
            at += length;
        }
    }
    return true;
}

} // namespace tamblo
