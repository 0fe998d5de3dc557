#pragma once

#include "base/Dictionary.h"
#include "base/UniqueFunction.h"

#include <cstdint>
#include <memory>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

namespace tamblo {

/// Keys of the dictionaries that a session is made with; the service's own.
namespace linkmeter {
inline constexpr std::string_view ClientType = "ClientType";
inline constexpr std::string_view ClientVersion = "ClientVersion";
inline constexpr std::string_view SessionID = "SessionID";
inline constexpr std::string_view BatchEvent = "BatchEvent";
inline constexpr std::string_view HierarchyToken = "HierarchyToken";
inline constexpr std::string_view ContainsRealtimeEvents = "ContainsRealtimeEvents";
inline constexpr std::string_view ClientBundleID = "ClientBundleID";
inline constexpr std::string_view ClientName = "ClientName";
inline constexpr std::string_view ServiceName = "ServiceName";
} // namespace linkmeter

/// The call-quality reporting service: takes the messages of its sessions and passes them on to the back ends
/// that it finds. Any thread; nothing here waits for a back end.
class CallQualityService {
public:
    /// One of the service's sessions. It ends when it is let go.
    class Session {
    public:
        virtual ~Session() = default;
        [[nodiscard]] virtual std::string description() const = 0;
    };
    using SessionRef = std::shared_ptr<Session>;
    /// The back ends that were found, nothing when there are none.
    using Completion = UniqueFunction<void(const std::optional<std::vector<std::string>>&)>;

    virtual ~CallQualityService() = default;
    /// What tells a session's place among others, under a parent token or, with an empty one, under none.
    /// Nothing when the service has no token to give.
    [[nodiscard]] virtual std::optional<std::string> NewHierarchyToken(std::string_view parent) = 0;
    [[nodiscard]] virtual SessionRef CreateLinkmeterSession(const Dictionary& sessionInfo,
                                                            const Dictionary& userInfo) = 0;
    /// Looks for back ends; answers once, later, on a thread of the service's own.
    virtual void StartConfiguration(const SessionRef& session, Completion completion) = 0;
    /// Sends one message, without the entry of the key `leftOut`, if any; answers why it could not, or
    /// nothing. Without a session, nothing is sent.
    [[nodiscard]] virtual std::optional<std::string>
    SendLinkmeterMessage(const SessionRef& session, std::uint16_t category, std::uint16_t type,
                         const Dictionary& payload, std::string_view leftOut) = 0;
    /// The same where it needs no waiting for anything, a disk or another thread. Answers whether it was
    /// done; what could not be sent counts as done.
    [[nodiscard]] virtual bool trySendLinkmeterMessage(const SessionRef& session, std::uint16_t category,
                                                       std::uint16_t type, const Dictionary& payload,
                                                       std::string_view leftOut) = 0;
    /// Sends what the service has held back.
    virtual void FlushMessages(const SessionRef& session) = 0;
};

} // namespace tamblo
