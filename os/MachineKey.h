#pragma once

#include <array>
#include <cstdint>
#include <string>
#include <string_view>

namespace tamblo {

/// The machine's secret identifier as the key of hashes, by which this machine tells things from one another
/// by their addresses, and tells nobody the addresses. On a machine that has no identifier the hash has no
/// secret, and does not hide an address from whoever tries all that there are. Any thread.
class MachineKey {
public:
    static constexpr const char* kFile = "/etc/machine-id";

    [[nodiscard]] static MachineKey read(const std::string& path = kFile);

    /// Of an address, in capital letters: the same in every program, and at every start.
    [[nodiscard]] std::string identifierOf(std::string_view text) const;

private:
    std::array<std::uint64_t, 2> words_{}; ///< zero without an identifier
};

} // namespace tamblo
