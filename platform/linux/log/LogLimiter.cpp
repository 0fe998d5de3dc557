#include "platform/linux/log/LogLimiter.h"

#include <algorithm>
#include <span>

namespace tamblo {

bool LogLimiter::admits(ClientIdentity client, const LogKind& kind, Time now) noexcept {
    const MutexLock lock(mutex_);
    User& user = userOf(client.user, now);
    Tally& tally = tallyOf(user, kind);
    const bool isError = kind.level >= LogLevel::error;
    unsigned& written = isError ? user.errors : user.lines;
    if (tally.written < kLinesOfKind && written < (isError ? kErrorsOfUser : kLinesOfUser)) {
        ++tally.written;
        ++written;
        return true;
    }
    ++tally.leftOut.lines;
    tally.leftOut.last = client;
    leftOut_.fetch_add(1, std::memory_order_relaxed);
    return false;
}

std::optional<LogLimiter::LeftOut> LogLimiter::takeLeftOut(Time now) noexcept {
    const MutexLock lock(mutex_);
    for (User& user : users_) {
        if (!user.isDue && now - user.began < kPeriod) {
            continue;
        }
        for (Tally& tally : std::span(user.tallies).first(user.kinds)) {
            if (tally.leftOut.lines != 0) {
                const LeftOut taken = tally.leftOut;
                tally.leftOut.lines = 0;
                leftOut_.fetch_sub(taken.lines, std::memory_order_relaxed);
                return taken;
            }
        }
        user.isDue = false;
    }
    return std::nullopt;
}

LogLimiter::User& LogLimiter::userOf(uid_t user, Time now) noexcept {
    const auto known = std::ranges::find(users_, user, &User::user);
    if (known != users_.end()) {
        if (now - known->began >= kPeriod) {
            beginPeriod(*known, now);
        }
        return *known;
    }
    if (users_.size() < kUsers) {
        return users_.emplace_back(User{.user = user, .began = now, .tallies = {}});
    }
    const auto quiet = std::ranges::find_if(
        users_, [now](const User& other) { return !other.isDue && now - other.began >= kPeriod; });
    if (quiet == users_.end()) {
        return users_.back();
    }
    quiet->user = user;
    beginPeriod(*quiet, now);
    return *quiet;
}

/// Kinds of which something is yet to be told keep their place until it is.
void LogLimiter::beginPeriod(User& user, Time now) noexcept {
    const auto known = std::span(user.tallies).first(user.kinds);
    const auto rest =
        std::ranges::remove_if(known, [](const Tally& tally) { return tally.leftOut.lines == 0; });
    user.kinds -= rest.size();
    for (Tally& tally : std::span(user.tallies).first(user.kinds)) {
        tally.written = 0;
    }
    user.began = now;
    user.lines = user.errors = 0;
    user.isDue = user.kinds != 0;
}

LogLimiter::Tally& LogLimiter::tallyOf(User& user, const LogKind& kind) noexcept {
    const auto known = std::span(user.tallies).first(user.kinds);
    const auto found = std::ranges::find_if(known, [&kind](const Tally& tally) {
        const LogKind& other = tally.leftOut.kind;
        // Constants of the program are the same text when they are in the same place.
        return other.format.data() == kind.format.data() && other.place.line() == kind.place.line();
    });
    if (found != known.end()) {
        return *found;
    }
    if (user.kinds == kKinds) {
        return user.tallies.back();
    }
    Tally& tally = user.tallies[user.kinds++];
    tally = {.leftOut = {.kind = kind, .last = {}, .lines = 0}, .written = 0};
    return tally;
}

} // namespace tamblo
