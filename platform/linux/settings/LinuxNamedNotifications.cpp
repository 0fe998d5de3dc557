#include "platform/linux/settings/LinuxNamedNotifications.h"

#include "base/Format.h"
#include "base/WhileAlive.h"
#include "os/ReplaceFile.h"
#include "os/SmallFile.h"

#include <atomic>
#include <cerrno>
#include <charconv>
#include <climits>
#include <cstdint>
#include <system_error>
#include <utility>

#include <sys/stat.h>

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

NamedNotifications::State stateIn(const SmallFile& file) noexcept {
    const std::string_view text = file.trimmed();
    std::uint64_t word = 0;
    const auto [end, error] = std::from_chars(text.data(), text.data() + text.size(), word);
    if (file.error != 0) {
        return {file.error, 0};
    }
    if (end != text.data() + text.size() || error == std::errc::invalid_argument) {
        return {EBADMSG, 0};
    }
    return error == std::errc() ? NamedNotifications::State{0, word} : NamedNotifications::State{ERANGE, 0};
}

/// What is wrong with a file, and where; empty for one that can be read, that is missing, or that is empty,
/// since its next writer may just have opened it.
std::string faultOf(const SmallFile& file, int status) {
    const std::string_view word = file.trimmed();
    if (status == 0 || file.isMissing() || (file.error == 0 && word.empty())) {
        return {};
    }
    return file.error != 0
               ? file.reason()
               : formatted("byte {}: not a 64-bit number in decimal", word.data() - file.text.data() + 1);
}

} // namespace

/// Gone once it is cancelled, unless its handler is running.
struct LinuxNamedNotifications::Registered {
    const int token;
    const std::string name;
    SerialQueue& queue;
    const Handler handler;
    std::atomic<bool> isCallWaiting{false};
};

LinuxNamedNotifications::LinuxNamedNotifications(std::string directory, StructuredLog& log)
    : log_(log), watcher_(std::move(directory), DirectoryWatcher::Watch::writes) {
    reportUnwatched();
}

void LinuxNamedNotifications::reportUnwatched() {
    const std::string fault = watcher_.fault();
    if (unwatched_.isNews(fault)) {
        log_.report(LogLevel::error, "zrrs",
                    formatted("{}; notifications posted there are not noticed", fault));
    }
}

bool LinuxNamedNotifications::isNews(ToldOnce Told::*of, std::string_view name, std::string_view fault) {
    const MutexLock lock(mutex_);
    return (told_[std::string(name)].*of).isNews(fault);
}

NamedNotifications::Registration LinuxNamedNotifications::RegisterNamedNotification(std::string_view name,
                                                                                    SerialQueue& queue,
                                                                                    Handler handler) {
    if (const int status = checkName(name)) {
        return {status, 0};
    }
    const MutexLock lock(mutex_);
    const int token = ++lastToken_;
    registered_.emplace(token,
                        std::make_shared<Registered>(token, std::string(name), queue, std::move(handler)));
    return {0, token};
}

NamedNotifications::State LinuxNamedNotifications::GetNamedNotificationState(int token) {
    std::string name;
    {
        const MutexLock lock(mutex_);
        const auto found = registered_.find(token);
        if (found == registered_.end()) {
            return {EBADF, 0};
        }
        name = found->second->name;
    }
    const std::string path = formatted("{}/{}", watcher_.directory(), name);
    const SmallFile file = SmallFile::read(path, kMaximumFile, SmallFile::Links::refused);
    const State state = stateIn(file);
    const std::string fault = faultOf(file, state.status);
    if (isNews(&Told::unreadable, name, fault.empty() ? fault : formatted("{}: {}", fault, file.text))) {
        log_.report(LogLevel::error, "zrrs", formatted("{}: {}; it is not used", path, fault));
    }
    return state;
}

int LinuxNamedNotifications::PostNamedNotification(std::string_view name) {
    const std::string path = formatted("{}/{}", watcher_.directory(), name);
    int status = checkName(name);
    if (status == 0) {
        const SmallFile file = SmallFile::read(path, kMaximumFile, SmallFile::Links::refused);
        // Content that is no word cannot be lost.
        const bool mayWrite = file.error == 0 || file.error == ENOENT || file.error == EFBIG;
        status = mayWrite ? replaceFileAtomically(path, formatted("{}\n", stateIn(file).word)) : file.error;
    }
    const std::string fault = status != 0 ? std::generic_category().message(status) : "";
    if (isNews(&Told::notPosted, name, fault)) {
        log_.report(LogLevel::error, "zrrs",
                    formatted("{}: {}; the notification is not posted", path, fault));
    }
    return status;
}

void LinuxNamedNotifications::CancelNamedNotification(int token) {
    // Let go after the lock: what the handler holds may cancel another registration when it ends.
    std::shared_ptr<Registered> ended;
    const MutexLock lock(mutex_);
    if (const auto found = registered_.find(token); found != registered_.end()) {
        ended = std::move(found->second);
        registered_.erase(found);
    }
}

/// The queue is alive: its registration has not been cancelled, and cannot be while the lock is held.
void LinuxNamedNotifications::post(const std::shared_ptr<Registered>& registered) {
    if (registered->isCallWaiting.exchange(true)) {
        return;
    }
    const auto call = [](Registered& called) {
        // Taken back first: a post that comes while the handler runs is another call.
        called.isCallWaiting.exchange(false);
        called.handler(called.token);
    };
    registered->queue.post(whileAlive(std::weak_ptr(registered), call), Pace::mayBlock);
}

/// In a time that nothing is known of.
bool LinuxNamedNotifications::mayHaveBeenPosted(const std::string& name) const noexcept {
    struct stat status {};
    return ::lstat(formatted("{}/{}", watcher_.directory(), name).c_str(), &status) == 0;
}

void LinuxNamedNotifications::deliverPosts(const std::function<void()>& beforeDelivery) {
    watcher_.read([this, &beforeDelivery](std::optional<std::string_view> name) {
        beforeDelivery();
        const MutexLock lock(mutex_);
        for (const auto& [token, registered] : registered_) {
            if (name ? registered->name == *name : mayHaveBeenPosted(registered->name)) {
                post(registered);
            }
        }
    });
    reportUnwatched();
}

} // namespace tamblo
