#pragma once

#include "base/Mutex.h"
#include "os/DirectoryWatcher.h"
#include "platform/NamedNotifications.h"
#include "platform/StructuredLog.h"
#include "platform/linux/settings/ToldOnce.h"

#include <functional>
#include <map>
#include <memory>
#include <string>
#include <string_view>

namespace tamblo {

/// Named notifications as files: `<directory>/<name>` holds the name's state word in decimal, and each
/// finished write of it (a close after writing, or another file renamed over it) is a post. Removing the file
/// or renaming it away is none; the state then cannot be read.
///
/// The kernel tells of the writes: the event loop calls `deliverPosts` when the descriptor is readable. Each
/// registration has at most one call waiting on its queue, however many posts come meanwhile: a call reads
/// the state when it runs, so that the last one is always seen. A post just before a registration may be told
/// to it. When the directory has come back, or more was posted than the kernel could remember, every name
/// that has a file may have been posted, and counts as such.
///
/// Statuses are `errno` values. Any thread may register, ask and cancel; no handler is called once this
/// object is gone.
class LinuxNamedNotifications final : public NamedNotifications {
public:
    /// The log must outlive the notifications.
    LinuxNamedNotifications(std::string directory, StructuredLog& log);

    /// Fails for a name that is no plain file name: `EINVAL`, or `ENAMETOOLONG`. Succeeds when the directory
    /// cannot be watched (said in the log): the state can be read all the same.
    [[nodiscard]] Registration RegisterNamedNotification(std::string_view name, SerialQueue& queue,
                                                         Handler handler) override;
    /// The word in the file at this moment. `EBADF` for an unknown token, `ENOENT` for a name that was never
    /// posted, `EBADMSG` for a file that does not hold one decimal number and nothing else but white space
    /// around it, `ERANGE` for one beyond 64 bits, and whatever keeps the file from being read. A symbolic
    /// link is `ELOOP`: writes through it would not be noticed. What stands there and cannot be read is one
    /// error line for each state of the file that is met.
    [[nodiscard]] State GetNamedNotificationState(int token) override;
    /// Replaces the file with one that holds the same word, or 0 for content that is no word. Fails for a
    /// name that cannot be registered, for what is no regular file, and for what cannot be written: one error
    /// line for each name until it can be posted again.
    [[nodiscard]] int PostNamedNotification(std::string_view name) override;
    void CancelNamedNotification(int token) override;

    /// For the event loop; -1 when posts cannot be noticed (said in the log).
    [[nodiscard]] int fileDescriptor() const noexcept { return watcher_.fileDescriptor(); }
    /// After a post has been taken in and before it is delivered, `beforeDelivery` takes in what its poster
    /// may have done before.
    void deliverPosts(const std::function<void()>& beforeDelivery = [] {});

private:
    struct Registered;
    /// Of one name.
    struct Told {
        ToldOnce unreadable;
        ToldOnce notPosted;
    };

    static void post(const std::shared_ptr<Registered>& registered);
    [[nodiscard]] bool mayHaveBeenPosted(const std::string& name) const noexcept;
    void reportUnwatched();
    [[nodiscard]] bool isNews(ToldOnce Told::*of, std::string_view name, std::string_view fault);

    StructuredLog& log_;
    /// Used by `deliverPosts` alone.
    DirectoryWatcher watcher_;
    ToldOnce unwatched_;
    Mutex mutex_;
    std::map<int, std::shared_ptr<Registered>> registered_ TAMBLO_GUARDED_BY(mutex_); ///< by token, a few
    int lastToken_ TAMBLO_GUARDED_BY(mutex_) = 0;
    std::map<std::string, Told, std::less<>> told_ TAMBLO_GUARDED_BY(mutex_);
};

} // namespace tamblo
