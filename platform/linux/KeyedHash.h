#pragma once

#include <array>
#include <cstdint>
#include <string_view>

namespace tamblo {

/// A secret of 128 bits.
using HashKey = std::array<std::uint64_t, 2>;

/// SipHash-2-4 (Aumasson and Bernstein, 2012): whoever does not have the key can neither tell the text from
/// its hash nor find it by trying all texts that there are.
[[nodiscard]] std::uint64_t keyedHash(const HashKey& key, std::string_view text) noexcept;

} // namespace tamblo
