#pragma once

#include <cstddef>
#include <optional>
#include <span>
#include <string_view>

namespace tamblo {

class Preferences;

/// The preferences domain in which a device's maker changes limits: numbers by name.
inline constexpr std::string_view kLimitsDomain = "com.vandra.tamblo.limits";

/// What the service grants its clients; read once, when the service starts.
///
/// The defaults lie far above honest use, and together keep the service below 256 MiB whatever the clients
/// of one user do. What a client that reaches one is answered stands in the table of `docs/protocol.md`. A
/// preference that is no number, or no positive one, counts as absent. The names of the members are those of
/// the preferences, in snake case there (`reporters_of_message`).
struct Limits {
    // Of one request.
    std::size_t reportersOfMessage = 128;
    std::size_t entriesOfDictionary = 1'024; ///< of a payload or configuration, inner maps included
    std::size_t keyBytes = 1'024;
    std::size_t bytesOfKeys = 64U << 10U;             ///< of all of a frame
    std::size_t decodedBytesOfFrame = 4U << 20U;      ///< as values in memory
    std::size_t deliveredBytesOfMessage = 16U << 20U; ///< its values, once for each reporter
    std::size_t applicationNameBytes = 512;

    // Of one session, connection or user.
    std::size_t configurationBytesOfSession = 64U << 10U;
    std::size_t configurationBytesOfUser = 8U << 20U;
    std::size_t previousKeysOfSession = 4'096;
    std::size_t sessionsOfConnection = 12'288;
    std::size_t sessionsOfUser = 16'384;
    std::size_t connectionsOfUser = 6'144;
    std::size_t retainedBytesOfUser = 64U << 20U;
    std::size_t retainedBytes = 112U << 20U; ///< of all users

    // Of what waits.
    std::size_t waitingRequests = 1'024;           ///< of a connection
    std::size_t waitingBytes = 4U << 20U;          ///< of a connection, as values in memory
    std::size_t waitingBytesOfUser = 8U << 20U;    ///< likewise
    std::size_t unfinishedBytesOfUser = 8U << 20U; ///< frames that have begun
    std::size_t frameSeconds = 10;                 ///< without progress of a frame that has begun
    std::size_t replyBytes = 4U << 20U;            ///< that a connection's socket has refused
    std::size_t replyBytesOfUser = 16U << 20U;     ///< likewise

    [[nodiscard]] static Limits read(const Preferences& preferences);

    /// A limit by its name.
    struct Row {
        std::string_view name;
        std::size_t Limits::*member;
    };
    [[nodiscard]] static std::span<const Row> rows() noexcept;
    /// What a device's maker has set the limit to; nothing where the default is in force.
    [[nodiscard]] static std::optional<std::size_t> preferenceOf(const Preferences& preferences,
                                                                 std::string_view name);
};

} // namespace tamblo
