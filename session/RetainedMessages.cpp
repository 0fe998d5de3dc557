#include "session/RetainedMessages.h"

#include "session/BlockingWork.h"
#include "session/ZRReportingSession.h"

#include <algorithm>
#include <utility>

#include <unistd.h>

namespace tamblo {

namespace {

/// Once a limit is passed, this part of it is made free, so that the search costs little for each message.
constexpr std::size_t kPartMadeFree = 16;

/// So much memory is worth being given back to the system.
constexpr std::size_t kMuchMemory = 8U << 20U;

/// The bytes beyond which the next search begins: where nothing can be let go, not with each message.
std::size_t nextRoundFor(std::size_t bytes, std::size_t limit) noexcept {
    return std::max(limit, bytes + (bytes > limit ? limit / kPartMadeFree : 0));
}

} // namespace

RetainedMessages::Share::Share(RetainedMessages& all, ZRReportingSession& session)
    : all_(all), session_(session) {
    join(::geteuid());
}

RetainedMessages::Share::~Share() {
    removeDerived(derivedBytes_);
    all_.freed(bytes_);
    leave();
}

void RetainedMessages::Share::join(uid_t user) {
    Account& account = all_.accounts_[user];
    if (account.shares.empty()) {
        account.user = user;
        account.nextRound = all_.limitOfUser_;
    }
    account_ = &account;
    place_ = account.shares.size();
    account.shares.push_back(this);
    all_.added(account, bytes_);
}

void RetainedMessages::Share::leave() noexcept {
    Account& account = *account_;
    account.shares.back()->place_ = place_;
    std::swap(account.shares[place_], account.shares.back());
    account.shares.pop_back();
    all_.removed(account, bytes_);
    if (account.shares.empty()) {
        all_.accounts_.erase(account.user);
    }
}

void RetainedMessages::Share::setUser(uid_t user) {
    if (user != account_->user) {
        leave();
        join(user);
    }
}

void RetainedMessages::Share::remove(std::size_t bytes) noexcept {
    bytes_ -= bytes;
    all_.removed(*account_, bytes);
}

void RetainedMessages::Share::removeDerived(std::size_t bytes) noexcept {
    derivedBytes_ -= bytes;
    account_->derivedBytes -= bytes;
    all_.derivedBytes_ -= bytes;
}

void RetainedMessages::Share::removeFreed(std::size_t bytes) {
    remove(bytes);
    all_.freed(bytes);
}

RetainedMessages::RetainedMessages(Context& context) noexcept
    : context_(context),
      activity_(*context.platform().activity),
      limitOfUser_(context.platform().limits.retainedBytesOfUser),
      limit_(context.platform().limits.retainedBytes),
      nextRound_(limit_) {}

void RetainedMessages::freed(std::size_t bytes) {
    freedBytes_ += bytes;
    if (freedBytes_ >= kMuchMemory) {
        freedBytes_ = 0;
        context_.shared<BlockingWork>(context_.platform()).giveBackMemorySoon();
    }
}

void RetainedMessages::removed(Account& account, std::size_t bytes) noexcept {
    account.bytes -= bytes;
    bytes_ -= bytes;
    activity_.retainedBytes.store(bytes_, std::memory_order_relaxed);
    account.nextRound = std::min(account.nextRound, nextRoundFor(account.bytes, limitOfUser_));
    nextRound_ = std::min(nextRound_, nextRoundFor(bytes_, limit_));
}

void RetainedMessages::makeRoom(Account& account) {
    if (account.bytes > account.nextRound) {
        letGo(account, account.bytes - (limitOfUser_ - limitOfUser_ / kPartMadeFree),
              "retained_bytes_of_user");
        account.nextRound = nextRoundFor(account.bytes, limitOfUser_);
    }
    if (bytes_ <= nextRound_) {
        return;
    }
    std::vector<Account*> accounts;
    accounts.reserve(accounts_.size());
    for (auto& [user, other] : accounts_) {
        accounts.push_back(&other);
    }
    std::sort(accounts.begin(), accounts.end(),
              [](const Account* a, const Account* b) { return a->bytes > b->bytes; });
    const std::size_t goal = limit_ - limit_ / kPartMadeFree;
    // Who has less than his share pays for nobody.
    const std::size_t share = goal / accounts.size();
    for (Account* const other : accounts) {
        if (bytes_ > goal && other->bytes > share) {
            letGo(*other, std::min(bytes_ - goal, other->bytes - share), "retained_bytes");
        }
    }
    nextRound_ = nextRoundFor(bytes_, limit_);
}

void RetainedMessages::letGo(Account& account, std::size_t bytes, std::string_view limit) {
    std::vector<std::pair<std::size_t, ZRReportingSession*>> sessions;
    for (const Share* const share : account.shares) {
        if (share->session_.maySpareMessages()) {
            sessions.emplace_back(share->bytes_, &share->session_);
        }
    }
    std::make_heap(sessions.begin(), sessions.end());
    for (std::size_t freed = 0; freed < bytes && !sessions.empty(); sessions.pop_back()) {
        std::pop_heap(sessions.begin(), sessions.end());
        freed += sessions.back().second->letGoOfOldest(bytes - freed, limit);
    }
}

} // namespace tamblo
