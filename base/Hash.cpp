#include "base/Hash.h"

#include <array>
#include <bit>
#include <cstring>
#include <random>

namespace tamblo {

namespace {

using Key = std::array<std::uint64_t, 2>;

const Key& keyOfProcess() noexcept {
    static const Key key = [] {
        std::random_device device;
        const auto word = [&device] { return std::uint64_t{device()} << 32U | device(); };
        return Key{word(), word()};
    }();
    return key;
}

/// The four words that SipHash works on.
class SipState {
public:
    explicit SipState(const Key& key) noexcept
        : a_(key[0] ^ 0x736F6D6570736575ULL),
          b_(key[1] ^ 0x646F72616E646F6DULL),
          c_(key[0] ^ 0x6C7967656E657261ULL),
          d_(key[1] ^ 0x7465646279746573ULL) {}

    void take(std::uint64_t word) noexcept {
        d_ ^= word;
        round();
        a_ ^= word;
    }
    [[nodiscard]] std::uint64_t finish() noexcept {
        c_ ^= 0xFFU;
        for (int i = 0; i < 3; ++i) {
            round();
        }
        return a_ ^ b_ ^ c_ ^ d_;
    }

private:
    void round() noexcept {
        a_ += b_;
        b_ = std::rotl(b_, 13) ^ a_;
        a_ = std::rotl(a_, 32);
        c_ += d_;
        d_ = std::rotl(d_, 16) ^ c_;
        a_ += d_;
        d_ = std::rotl(d_, 21) ^ a_;
        c_ += b_;
        b_ = std::rotl(b_, 17) ^ c_;
        c_ = std::rotl(c_, 32);
    }

    std::uint64_t a_;
    std::uint64_t b_;
    std::uint64_t c_;
    std::uint64_t d_;
};

} // namespace

SeededHash::SeededHash() noexcept : seed(keyOfProcess()[0]) {}

std::size_t SeededTextHash::operator()(std::string_view text) const noexcept {
    SipState state(keyOfProcess());
    const std::uint64_t length = text.size();
    std::uint64_t word = 0;
    for (; text.size() >= sizeof word; text.remove_prefix(sizeof word)) {
        std::memcpy(&word, text.data(), sizeof word);
        state.take(word);
    }
    word = 0;
    if (!text.empty()) {
        std::memcpy(&word, text.data(), text.size());
    }
    state.take(word | length << 56U);
    return state.finish();
}

} // namespace tamblo
