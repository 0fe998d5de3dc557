#pragma once

#include "platform/Counters.h"

#include <array>
#include <cstdint>
#include <string_view>

namespace tamblo::counters {

/// The file of the counters, in the runtime directory: this header, then `kSlots` counters of 64 bits each,
/// as the machine writes them. The service keeps it (`CounterFile`); who reads it takes a file of another
/// magic or layout for none.
inline constexpr std::string_view kFileName = "counters";
inline constexpr std::string_view kFileMagic = "tamblo#1";

struct FileHeader {
    std::array<char, 8> magic{};
    std::uint64_t layout = 0;    ///< `layoutHash` of the program that keeps the file
    std::uint64_t began = 0;     ///< when the counters began, in nanoseconds since 1970
    std::array<char, 40> boot{}; ///< the kernel's identifier of the boot, and zeros

    [[nodiscard]] bool hasMagic() const noexcept {
        return std::string_view(magic.data(), magic.size()) == kFileMagic;
    }
};
static_assert(sizeof(FileHeader) == 64 && kFileMagic.size() == sizeof FileHeader::magic);

} // namespace tamblo::counters
