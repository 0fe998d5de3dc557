#pragma once

#include "util/Context.h"

#include <cstddef>
#include <map>
#include <string_view>
#include <vector>

#include <sys/types.h>

namespace tamblo {

class ZRReportingSession;

/// What all sessions retain, by the user whose client made them, and what happens when that is too much.
///
/// A session may last for days, and nobody is to lose a report for that; but its messages are memory. So each
/// user has a budget of bytes, and all of them have one together. Beyond the first, the oldest messages of
/// the user's largest sessions are let go, beyond the second, those of the user who has most; enough of them
/// that it is worth the search for them. A session that is stopping keeps what it has. A message that is let
/// go has reached its sinks, but what is derived at the stop is derived without it. One for all sessions, on
/// the reporting server queue.
class RetainedMessages {
    struct Account;

public:
    /// What one session has a share of; it must not outlive the object that it was made of.
    class Share {
    public:
        /// Belongs to the service's own user at first.
        Share(RetainedMessages& all, ZRReportingSession& session);
        ~Share();
        Share(const Share&) = delete;
        Share& operator=(const Share&) = delete;

        void setUser(uid_t user);
        /// More bytes; may let go of messages, the session's own too.
        void add(std::size_t bytes) {
            bytes_ += bytes;
            all_.added(*account_, bytes);
        }
        void remove(std::size_t bytes) noexcept;
        /// The same for what is free now: once much is, the system is given it back soon.
        void removeFreed(std::size_t bytes);
        /// What a stop derives, which nothing is let go for: what more would be has to be left out instead.
        void addDerived(std::size_t bytes) noexcept {
            derivedBytes_ += bytes;
            account_->derivedBytes += bytes;
            all_.derivedBytes_ += bytes;
        }
        void removeDerived(std::size_t bytes) noexcept;
        [[nodiscard]] std::size_t bytes() const noexcept { return bytes_; }
        [[nodiscard]] bool hasRoomForDerived() const noexcept {
            return account_->derivedBytes < kMostDerivedBytesOfUser && all_.derivedBytes_ < kMostDerivedBytes;
        }

    private:
        friend class RetainedMessages;

        void join(uid_t user);
        void leave() noexcept;

        RetainedMessages& all_;
        ZRReportingSession& session_;
        Account* account_ = nullptr;
        std::size_t place_ = 0; ///< among the account's shares
        std::size_t bytes_ = 0;
        std::size_t derivedBytes_ = 0;
    };

    static constexpr std::size_t kMostDerivedBytesOfUser = 64U << 20U;
    static constexpr std::size_t kMostDerivedBytes = 96U << 20U;

    explicit RetainedMessages(Context& context) noexcept;
    RetainedMessages(const RetainedMessages&) = delete;
    RetainedMessages& operator=(const RetainedMessages&) = delete;

    /// Calls `act` with the number and the bytes of each user who has a session.
    template <typename Act> void forEachUser(Act act) const {
        for (const auto& [user, account] : accounts_) {
            act(user, account.bytes);
        }
    }
    /// Bytes of all sessions.
    [[nodiscard]] std::size_t bytes() const noexcept { return bytes_; }

private:
    struct Account {
        uid_t user = 0;
        std::size_t bytes = 0;
        std::size_t derivedBytes = 0;
        std::size_t nextRound = 0; ///< bytes beyond which something is let go
        std::vector<Share*> shares;
    };

    void added(Account& account, std::size_t bytes) {
        account.bytes += bytes;
        bytes_ += bytes;
        activity_.retainedBytes.store(bytes_, std::memory_order_relaxed);
        if (account.bytes > account.nextRound || bytes_ > nextRound_) {
            makeRoom(account);
        }
    }
    void removed(Account& account, std::size_t bytes) noexcept;
    void freed(std::size_t bytes);
    void makeRoom(Account& account);
    /// Lets go of about as many bytes, of the largest sessions first.
    static void letGo(Account& account, std::size_t bytes, std::string_view limit);

    Context& context_;
    Activity& activity_; ///< is told of the bytes
    const std::size_t limitOfUser_;
    const std::size_t limit_;
    std::map<uid_t, Account> accounts_; ///< of users who have a session
    std::size_t bytes_ = 0;
    std::size_t derivedBytes_ = 0;
    std::size_t nextRound_;
    std::size_t freedBytes_ = 0; ///< since the system was given some back
};

} // namespace tamblo
