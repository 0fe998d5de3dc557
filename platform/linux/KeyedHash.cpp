#include "platform/linux/KeyedHash.h"

#include <bit>
#include <cstddef>

namespace tamblo {

namespace {

class SipState {
public:
    explicit SipState(const HashKey& key) noexcept
        : v0_(key[0] ^ 0x736F6D6570736575U),
          v1_(key[1] ^ 0x646F72616E646F6DU),
          v2_(key[0] ^ 0x6C7967656E657261U),
          v3_(key[1] ^ 0x7465646279746573U) {}

    void take(std::uint64_t word) noexcept {
        v3_ ^= word;
        rounds(2);
        v0_ ^= word;
    }
    [[nodiscard]] std::uint64_t finish() noexcept {
        v2_ ^= 0xFFU;
        rounds(4);
        return v0_ ^ v1_ ^ v2_ ^ v3_;
    }

private:
    void rounds(int count) noexcept {
        for (int i = 0; i < count; ++i) {
            v0_ += v1_;
            v1_ = std::rotl(v1_, 13) ^ v0_;
            v0_ = std::rotl(v0_, 32);
            v2_ += v3_;
            v3_ = std::rotl(v3_, 16) ^ v2_;
            v0_ += v3_;
            v3_ = std::rotl(v3_, 21) ^ v0_;
            v2_ += v1_;
            v1_ = std::rotl(v1_, 17) ^ v2_;
            v2_ = std::rotl(v2_, 32);
        }
    }

    std::uint64_t v0_;
    std::uint64_t v1_;
    std::uint64_t v2_;
    std::uint64_t v3_;
};

} // namespace

std::uint64_t keyedHash(const HashKey& key, std::string_view text) noexcept {
    SipState state(key);
    // Words of eight bytes, the lowest first; the last one has the length in its highest byte.
    std::uint64_t word = 0;
    for (std::size_t i = 0; i < text.size(); ++i) {
        word |= std::uint64_t{static_cast<unsigned char>(text[i])} << 8U * (i % 8);
        if (i % 8 == 7) {
            state.take(word);
            word = 0;
        }
    }
    state.take(word | std::uint64_t{text.size()} << 56U);
    return state.finish();
}

} // namespace tamblo
