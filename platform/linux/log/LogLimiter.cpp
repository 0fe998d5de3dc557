#include "platform/linux/log/LogLimiter.h"

#include <algorithm>
#include <span>
#include <utility>

namespace tamblo {

namespace {

bool isSame(const LogKind& kind, const LogKind& other) noexcept {
    // Constants of the program are the same text when they are in the same place.
    return kind.format.data() == other.format.data() && kind.place.line() == other.place.line();
}

} // namespace

bool LogLimiter::admits(ClientIdentity client, const LogKind& kind, Time now) noexcept {
    const MutexLock lock(mutex_);
    User& user = userOf(client.user, now);
    Tally& tally = tallyOf(user, client.process, kind);
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
        for (Tally& tally : std::span(user.tallies).first(user.tallied)) {
            if (tally.leftOut.lines != 0) {
                const LeftOut taken = takeAllLike(tally.leftOut.kind, user);
                leftOut_.fetch_sub(taken.lines, std::memory_order_relaxed);
                return taken;
            }
        }
        user.isDue = false;
    }
    return std::nullopt;
}

/// One line tells of all clients, as there may be many.
LogLimiter::LeftOut LogLimiter::takeAllLike(const LogKind& kind, User& user) noexcept {
    LeftOut all{.kind = kind, .last = {}, .lines = 0};
    for (Tally& tally : std::span(user.tallies).first(user.tallied)) {
        if (tally.leftOut.lines != 0 && isSame(tally.leftOut.kind, kind)) {
            all.last = tally.leftOut.last;
            all.lines += std::exchange(tally.leftOut.lines, 0);
        }
    }
    return all;
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

/// Those of which something is yet to be told keep their place until it is.
void LogLimiter::beginPeriod(User& user, Time now) noexcept {
    const auto known = std::span(user.tallies).first(user.tallied);
    const auto rest =
        std::ranges::remove_if(known, [](const Tally& tally) { return tally.leftOut.lines == 0; });
    user.tallied -= rest.size();
    for (Tally& tally : std::span(user.tallies).first(user.tallied)) {
        tally.written = 0;
    }
    user.began = now;
    user.lines = user.errors = 0;
    user.isDue = user.tallied != 0;
}

LogLimiter::Tally& LogLimiter::tallyOf(User& user, pid_t process, const LogKind& kind) noexcept {
    const auto known = std::span(user.tallies).first(user.tallied);
    const auto found = std::ranges::find_if(known, [process, &kind](const Tally& tally) {
        return tally.process == process && isSame(tally.leftOut.kind, kind);
    });
    if (found != known.end()) {
        return *found;
    }
    if (user.tallied == kTallies) {
        return user.tallies.back();
    }
    Tally& tally = user.tallies[user.tallied++];
    tally = {.leftOut = {.kind = kind, .last = {}, .lines = 0}, .process = process, .written = 0};
    return tally;
}

} // namespace tamblo
