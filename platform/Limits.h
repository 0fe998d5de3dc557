#pragma once

#include <array>
#include <cstddef>
#include <optional>
#include <string_view>

namespace tamblo {

class Preferences;

/// What the service grants its clients; read once, when the service starts.
///
/// The defaults lie far above honest use, and together keep the service below 256 MiB whatever the clients
/// of one user do. What a client that reaches one is answered stands in the table of `docs/protocol.md`. A
/// preference that is no number, or no positive one, counts as absent. `kLimitRows` says what each limits.
struct Limits {
    // Of one request.
    std::size_t reportersOfMessage = 128;
    std::size_t entriesOfDictionary = 1'024;
    std::size_t keyBytes = 1'024;
    std::size_t bytesOfKeys = 64U << 10U;
    std::size_t decodedBytesOfFrame = 4U << 20U;
    std::size_t deliveredBytesOfMessage = 16U << 20U;
    std::size_t applicationNameBytes = 512;

    // Of one session, connection or user.
    std::size_t configurationBytesOfSession = 64U << 10U;
    std::size_t configurationBytesOfUser = 8U << 20U;
    std::size_t previousKeysOfSession = 4'096;
    std::size_t sessionsOfConnection = 12'288;
    std::size_t sessionsOfUser = 16'384;
    std::size_t connectionsOfUser = 6'144;
    std::size_t retainedBytesOfUser = 64U << 20U;
    std::size_t retainedBytes = 112U << 20U;

    // Of what waits.
    std::size_t waitingRequests = 1'024;
    std::size_t waitingBytes = 4U << 20U;
    std::size_t waitingBytesOfUser = 8U << 20U;
    std::size_t unfinishedBytesOfUser = 8U << 20U;
    std::size_t frameSeconds = 10;
    std::size_t replyBytes = 4U << 20U;
    std::size_t replyBytesOfUser = 16U << 20U;

    [[nodiscard]] static Limits read(const Preferences& preferences);
    /// What a device's maker has set the limit to; nothing where the default is in force.
    [[nodiscard]] static std::optional<std::size_t> preferenceOf(const Preferences& preferences,
                                                                 std::string_view name);
};

/// A limit, as people and the protocol know it.
struct LimitRow {
    std::string_view name; ///< of its preference, and what a client that reaches it is told
    std::size_t Limits::*member;
    std::string_view what;
};
inline constexpr std::array kLimitRows = std::to_array<LimitRow>({
    {"reporters_of_message", &Limits::reportersOfMessage, "reporters that a message names"},
    {"entries_of_dictionary", &Limits::entriesOfDictionary,
     "entries of a payload or configuration, inner maps included"},
    {"key_bytes", &Limits::keyBytes, "bytes of a key"},
    {"bytes_of_keys", &Limits::bytesOfKeys, "bytes of all keys of a frame"},
    {"decoded_bytes_of_frame", &Limits::decodedBytesOfFrame, "bytes of a frame's values in memory"},
    {"delivered_bytes_of_message", &Limits::deliveredBytesOfMessage,
     "bytes of a message's values, once for each reporter"},
    {"application_name_bytes", &Limits::applicationNameBytes, "bytes of an application's name"},
    {"configuration_bytes_of_session", &Limits::configurationBytesOfSession,
     "bytes of a session's configuration"},
    {"configuration_bytes_of_user", &Limits::configurationBytesOfUser,
     "bytes of all configurations of a user"},
    {"previous_keys_of_session", &Limits::previousKeysOfSession,
     "keys whose previous values a session remembers"},
    {"sessions_of_connection", &Limits::sessionsOfConnection, "sessions of a connection"},
    {"sessions_of_user", &Limits::sessionsOfUser, "sessions of a user"},
    {"connections_of_user", &Limits::connectionsOfUser, "connections of a user"},
    {"retained_bytes_of_user", &Limits::retainedBytesOfUser, "bytes that a user's sessions retain"},
    {"retained_bytes", &Limits::retainedBytes, "bytes that all sessions retain"},
    {"waiting_requests", &Limits::waitingRequests, "requests of a connection that wait"},
    {"waiting_bytes", &Limits::waitingBytes, "bytes of these requests in memory"},
    {"waiting_bytes_of_user", &Limits::waitingBytesOfUser, "bytes of all requests of a user that wait"},
    {"unfinished_bytes_of_user", &Limits::unfinishedBytesOfUser, "bytes of a user's frames that have begun"},
    {"frame_seconds", &Limits::frameSeconds, "seconds without progress of a frame that has begun"},
    {"reply_bytes", &Limits::replyBytes, "bytes of replies that a connection's socket has refused"},
    {"reply_bytes_of_user", &Limits::replyBytesOfUser,
     "bytes of replies that all sockets of a user have refused"},
});

} // namespace tamblo
