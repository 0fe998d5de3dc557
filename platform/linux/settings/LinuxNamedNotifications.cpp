#include "platform/linux/settings/LinuxNamedNotifications.h"

#include "base/Format.h"
#include "os/ReplaceFile.h"
#include "os/SmallFile.h"

#include <atomic>
#include <cerrno>
#include <charconv>
#include <climits>
#include <cstdint>
#include <limits>
#include <system_error>
#include <utility>

namespace tamblo {

namespace {

/// Room for the longest word and for generous white space.
constexpr std::size_t kMaximumFile = 256;

/// Whether a name is the name of a file in the directory and of nothing else.
int checkName(std::string_view name) noexcept {
    if (name.empty() || name.front() == '.' ||
        name.find_first_of(std::string_view("/\0", 2)) != std::string_view::npos) {
        return EINVAL;
    }
    return name.size() > NAME_MAX ? ENAMETOOLONG : 0;
}

NamedNotifications::State parseState(std::string_view text) noexcept {
    std::uint64_t word = 0;
    const auto [end, error] = std::from_chars(text.data(), text.data() + text.size(), word);
    if (end != text.data() + text.size() || error == std::errc::invalid_argument) {
        return {EBADMSG, 0};
    }
    return error == std::errc() ? NamedNotifications::State{0, word} : NamedNotifications::State{ERANGE, 0};
}

/// What is wrong with a file, and where; empty for one that can be read, that is missing, or that is empty,
/// since its next writer may just have opened it.
std::string faultOf(const SmallFile& file, int status) {
    const std::string_view word = file.trimmed();
    if (status == 0 || status == ENOENT || status == ENOTDIR || (file.error == 0 && word.empty())) {
        return {};
    }
    return file.error != 0
               ? std::generic_category().message(file.error)
               : formatted("byte {}: not a 64-bit number in decimal", word.data() - file.text.data() + 1);
}

} // namespace

/// Shared with the calls that wait on the queue, which may outlast the registration.
struct LinuxNamedNotifications::Registered {
    const int token;
    SerialQueue& queue;
    const Handler handler;
    std::atomic<bool> isCallWaiting{false};
    std::atomic<bool> isCancelled{false};
};

LinuxNamedNotifications::LinuxNamedNotifications(std::string directory, StructuredLog& log)
    : log_(log), watcher_(std::move(directory)) {
    reportUnwatched();
}

void LinuxNamedNotifications::reportUnwatched() {
    const int error = watcher_.error();
    if (error != std::exchange(reportedError_, error) && error != 0) {
        log_.report(LogLevel::error, "zrrs",
                    formatted("{}: {}; notifications posted there are not noticed", watcher_.directory(),
                              std::generic_category().message(error)));
    }
}

NamedNotifications::Registration LinuxNamedNotifications::RegisterNamedNotification(std::string_view name,
                                                                                    SerialQueue& queue,
                                                                                    Handler handler) {
    if (const int status = checkName(name)) {
        return {status, 0};
    }
    const MutexLock lock(mutex_);
    do {
        lastToken_ = lastToken_ == std::numeric_limits<int>::max() ? 1 : lastToken_ + 1;
    } while (byToken_.contains(lastToken_));
    auto registered = std::make_shared<Registered>(lastToken_, queue, std::move(handler));
    byToken_.emplace(lastToken_, byName_.emplace(name, std::move(registered)));
    return {0, lastToken_};
}

NamedNotifications::State LinuxNamedNotifications::GetNamedNotificationState(int token) {
    std::string name;
    {
        const MutexLock lock(mutex_);
        const auto found = byToken_.find(token);
        if (found == byToken_.end()) {
            return {EBADF, 0};
        }
        name = found->second->first;
    }
    const SmallFile file = SmallFile::read(formatted("{}/{}", watcher_.directory(), name), kMaximumFile,
                                           SmallFile::Links::refused);
    const State state = file.error != 0 ? State{file.error, 0} : parseState(file.trimmed());
    reportUnreadable(name, file.text, faultOf(file, state.status));
    return state;
}

void LinuxNamedNotifications::reportUnreadable(const std::string& name, const std::string& content,
                                               std::string_view fault) {
    {
        const MutexLock lock(mutex_);
        if (fault.empty()) {
            reported_.erase(name);
            return;
        }
        std::string state = formatted("{}: {}", fault, content);
        if (std::string& reported = reported_[name]; reported != state) {
            reported = std::move(state);
        } else {
            return;
        }
    }
    log_.report(LogLevel::error, "zrrs",
                formatted("{}/{}: {}; it is not used", watcher_.directory(), name, fault));
}

int LinuxNamedNotifications::PostNamedNotification(std::string_view name) {
    int status = checkName(name);
    if (status == 0) {
        const std::string path = formatted("{}/{}", watcher_.directory(), name);
        const SmallFile file = SmallFile::read(path, kMaximumFile, SmallFile::Links::refused);
        // Content that is no word cannot be lost.
        const bool mayWrite = file.error == 0 || file.error == ENOENT || file.error == EFBIG;
        status = mayWrite ? replaceFileAtomically(path, formatted("{}\n", parseState(file.trimmed()).word))
                          : file.error;
    }
    reportNotPosted(name, status);
    return status;
}

void LinuxNamedNotifications::reportNotPosted(std::string_view name, int status) {
    {
        const MutexLock lock(mutex_);
        const auto known = notPosted_.find(name);
        if (status == 0) {
            if (known != notPosted_.end()) {
                notPosted_.erase(known);
            }
            return;
        }
        if (known != notPosted_.end()) {
            return;
        }
        notPosted_.emplace(name);
    }
    log_.report(LogLevel::error, "zrrs",
                formatted("{}/{}: {}; the notification is not posted", watcher_.directory(), name,
                          std::generic_category().message(status)));
}

void LinuxNamedNotifications::CancelNamedNotification(int token) {
    // Let go after the lock: what the handler holds may cancel another registration when it ends.
    std::shared_ptr<Registered> registered;
    const MutexLock lock(mutex_);
    const auto found = byToken_.find(token);
    if (found == byToken_.end()) {
        return;
    }
    registered = std::move(found->second->second);
    registered->isCancelled = true;
    byName_.erase(found->second);
    byToken_.erase(found);
}

/// The queue is alive: its registration has not been cancelled, and cannot be while the lock is held.
void LinuxNamedNotifications::post(const std::shared_ptr<Registered>& registered) {
    if (registered->isCallWaiting.exchange(true)) {
        return;
    }
    registered->queue.post(
        [registered] {
            // Taken back first: a post that comes while the handler runs is another call.
            registered->isCallWaiting.exchange(false);
            if (!registered->isCancelled) {
                registered->handler(registered->token);
            }
        },
        Pace::mayBlock);
}

void LinuxNamedNotifications::deliverPosts(const std::function<void()>& beforeDelivery) {
    watcher_.read([this, &beforeDelivery](std::optional<std::string_view> name) {
        beforeDelivery();
        const MutexLock lock(mutex_);
        auto [first, last] = name ? byName_.equal_range(*name) : std::pair(byName_.begin(), byName_.end());
        for (; first != last; ++first) {
            post(first->second);
        }
    });
    reportUnwatched();
}

} // namespace tamblo
