#pragma once

#include "base/Mutex.h"
#include "platform/Platform.h"

#include <memory>
#include <typeindex>
#include <utility>
#include <vector>

namespace tamblo {

/// What the whole service has in common: the platform's services, the reporting server queue, and whatever
/// the sessions share.
///
/// Made by `main`, or by a test's fixture, and handed down to the service, the sessions and their workers.
/// All of these go before it; what they have posted is worked off as its first act of going. While it is
/// there it is the context of the process, of which there is one at a time: for log lines, and for those
/// functions whose names are known without an argument. Any thread.
class Context {
public:
    /// The platform outlives the context.
    explicit Context(const Platform& platform);
    ~Context();
    Context(const Context&) = delete;
    Context& operator=(const Context&) = delete;

    /// The context of the process. While there is none, calling this is a fault.
    [[nodiscard]] static Context& current() noexcept;

    [[nodiscard]] const Platform& platform() const noexcept { return platform_; }
    /// The one queue on which all session work runs, one piece at a time.
    [[nodiscard]] SerialQueue& serverQueue() const noexcept { return *serverQueue_; }
    /// As the device has answered when the context was made; without an answer it is none.
    [[nodiscard]] bool isInternalBuild() const noexcept { return isInternalBuild_; }

    /// The one `Shared` of this context, made of the first call's arguments and gone with the context.
    /// Whoever needs it for each message asks once and keeps the reference. Its constructor may not ask for
    /// another.
    template <typename Shared, typename... Arguments> [[nodiscard]] Shared& shared(Arguments&&... arguments) {
        const MutexLock lock(mutex_);
        for (const auto& [type, object] : shared_) {
            if (type == typeid(Shared)) {
                return *static_cast<Shared*>(object.get());
            }
        }
        auto made = std::make_shared<Shared>(std::forward<Arguments>(arguments)...);
        Shared& object = *made;
        shared_.emplace_back(typeid(Shared), std::move(made));
        return object;
    }

private:
    const Platform& platform_;
    const std::unique_ptr<SerialQueue> serverQueue_;
    const bool isInternalBuild_;

    Mutex mutex_;
    std::vector<std::pair<std::type_index, std::shared_ptr<void>>> shared_ TAMBLO_GUARDED_BY(mutex_);
};

/// The same of the context of the process, for code that is handed no context.
[[nodiscard]] inline SerialQueue& ZRReportingUtilityGetReportingServerQueue() noexcept {
    return Context::current().serverQueue();
}
[[nodiscard]] inline bool ZRReportingUtilityIsInternalBuild() noexcept {
    return Context::current().isInternalBuild();
}

} // namespace tamblo
