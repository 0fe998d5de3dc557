#include "os/MachineKey.h"

#include "base/Format.h"
#include "os/SmallFile.h"

#include <array>
#include <bit>
#include <charconv>
#include <cstddef>

namespace tamblo {

namespace {

/// The file has 33 bytes.
constexpr std::size_t kLongestMachineIdentifier = 64;

/// SipHash-2-4 (Aumasson and Bernstein, 2012): whoever does not have the key can neither tell the text from
/// its hash nor find it by trying all texts that there are.
std::uint64_t keyedHash(const std::array<std::uint64_t, 2>& key, std::string_view text) noexcept {
    std::array<std::uint64_t, 4> v{key[0] ^ 0x736F6D6570736575U, key[1] ^ 0x646F72616E646F6DU,
                                   key[0] ^ 0x6C7967656E657261U, key[1] ^ 0x7465646279746573U};
    const auto rounds = [&v](int count) {
        for (int i = 0; i < count; ++i) {
            v[0] += v[1];
            v[1] = std::rotl(v[1], 13) ^ v[0];
            v[0] = std::rotl(v[0], 32);
            v[2] += v[3];
            v[3] = std::rotl(v[3], 16) ^ v[2];
            v[0] += v[3];
            v[3] = std::rotl(v[3], 21) ^ v[0];
            v[2] += v[1];
            v[1] = std::rotl(v[1], 17) ^ v[2];
            v[2] = std::rotl(v[2], 32);
        }
    };
    const auto take = [&v, &rounds](std::uint64_t word) {
        v[3] ^= word;
        rounds(2);
        v[0] ^= word;
    };
    // Words of eight bytes, the lowest first; the last one has the length in its highest byte.
    std::uint64_t word = 0;
    for (std::size_t i = 0; i < text.size(); ++i) {
        word |= std::uint64_t{static_cast<unsigned char>(text[i])} << 8U * (i % 8);
        if (i % 8 == 7) {
            take(word);
            word = 0;
        }
    }
    take(word | std::uint64_t{text.size()} << 56U);
    v[2] ^= 0xFFU;
    rounds(4);
    return v[0] ^ v[1] ^ v[2] ^ v[3];
}

} // namespace

/// 32 hexadecimal digits.
MachineKey MachineKey::read(const std::string& path) {
    const SmallFile file = SmallFile::read(path, kLongestMachineIdentifier);
    const std::string_view digits = file.trimmed();
    MachineKey key;
    for (std::size_t i = 0; i < key.words_.size() && digits.size() == 32; ++i) {
        const char* begin = digits.data() + 16 * i;
        std::from_chars(begin, begin + 16, key.words_[i], 16);
    }
    return key;
}

std::string MachineKey::identifierOf(std::string_view text) const {
    return formatted("{}", hexadecimal(keyedHash(words_, text), 16));
}

} // namespace tamblo
