#include "bridge/pipewire/server/Profiler.h"

#include "bridge/pipewire/server/Context.h"
#include "bridge/pipewire/server/Cycles.h"
#include "bridge/pipewire/server/Proxy.h"

#include <array>
#include <cerrno>
#include <cstddef>
#include <cstring>
#include <new>
#include <utility>

#include <pipewire/extensions/profiler.h>
#include <pipewire/pipewire.h>

namespace tamblo::pipewire {

using std::chrono::milliseconds;

namespace {

constexpr std::array<const char*, 2> kModules{"libpipewire-module-protocol-native",
                                              "libpipewire-module-profiler"};

/// The server's answers to a new connection: looked for this often, so many times.
constexpr milliseconds kAnswerInterval{20};
constexpr unsigned kMostAnswers = 50;

/// The socket holds some 200 KiB. After half of that there may be more that waits in the server: it is given
/// this long to send it.
constexpr std::size_t kMayBeMore = 100U << 10U;
constexpr int kForMoreMilliseconds = 2;
/// What one reading may bring.
constexpr std::size_t kMostBytes = 1U << 20U;

} // namespace

class Profiler::Connection {
public:
    explicit Connection(CycleObserver& observer) : observer_(observer), loop_(pw_loop_new(nullptr)) {
        if (loop_ == nullptr) {
            throw std::bad_alloc();
        }
        try {
            context_ = makeContext(loop_, kModules);
        } catch (...) {
            pw_loop_destroy(loop_);
            throw;
        }
    }
    ~Connection() {
        close();
        pw_context_destroy(context_);
        pw_loop_destroy(loop_);
    }
    Connection(const Connection&) = delete;
    Connection& operator=(const Connection&) = delete;

    [[nodiscard]] bool isOpen() const noexcept { return core_ != nullptr; }
    /// Whether cycles come; while they do not, `mayStillCome` tells whether it is worth to look again.
    [[nodiscard]] bool isBound() const noexcept { return profiler_ != nullptr; }
    [[nodiscard]] bool mayStillCome() noexcept { return isBound() || ++looks_ < kMostAnswers; }

    bool open() {
        core_ = pw_context_connect(context_, nullptr, 0);
        if (core_ == nullptr) {
            return false;
        }
        hasGone_ = false;
        looks_ = 0;
        pw_core_add_listener(core_, &coreHook_, &kCoreEvents, this);
        registry_ = static_cast<pw_registry*>(pw_core_get_registry(core_, PW_VERSION_REGISTRY, 0));
        pw_registry_add_listener(registry_, &registryHook_, &kRegistryEvents, this);
        return true;
    }

    void close() {
        if (core_ == nullptr) {
            return;
        }
        profiler_.reset();
        closeRegistry();
        spa_hook_remove(&coreHook_);
        pw_core_disconnect(std::exchange(core_, nullptr));
        id_ = kNoObject;
    }

    /// Everything that has come; false when there is too much, or the server has gone.
    [[nodiscard]] bool read() {
        std::size_t all = 0;
        pw_loop_enter(loop_);
        do {
            bytes_ = 0;
            while (pw_loop_iterate(loop_, all == 0 ? 0 : kForMoreMilliseconds) > 0 && bytes_ < kMayBeMore) {
            }
            all += bytes_;
        } while (bytes_ >= kMayBeMore && all < kMostBytes);
        if (id_ != kNoObject && profiler_ == nullptr && !hasGone_) {
            bind();
            pw_loop_iterate(loop_, 0);
        }
        pw_loop_leave(loop_);
        return !hasGone_ && all < kMostBytes;
    }

private:
    void bind() {
        profiler_ = std::make_unique<Proxy<pw_profiler>>(registry_, id_, PW_TYPE_INTERFACE_Profiler,
                                                         PW_VERSION_PROFILER);
        if (profiler_->get() != nullptr) {
            pw_profiler_add_listener(profiler_->get(), profiler_->hook(), &kProfilerEvents, this);
        }
        // What else comes and goes in the server is not told over this connection, too.
        closeRegistry();
    }

    void closeRegistry() {
        if (registry_ != nullptr) {
            spa_hook_remove(&registryHook_);
            pw_proxy_destroy(reinterpret_cast<pw_proxy*>(std::exchange(registry_, nullptr)));
        }
    }

    static void failed(void* data, std::uint32_t id, int, int result, const char*) {
        if (id == PW_ID_CORE && result == -EPIPE) {
            static_cast<Connection*>(data)->hasGone_ = true;
        }
    }
    static void appeared(void* data, std::uint32_t id, std::uint32_t, const char* type, std::uint32_t,
                         const spa_dict*) {
        if (std::strcmp(type, PW_TYPE_INTERFACE_Profiler) == 0) {
            static_cast<Connection*>(data)->id_ = id;
        }
    }
    static void profiled(void* data, const spa_pod* profile) {
        auto& self = *static_cast<Connection*>(data);
        self.bytes_ += profile == nullptr ? 0 : SPA_POD_SIZE(profile);
        readCycles(profile, self.observer_);
    }
    static const pw_core_events kCoreEvents;
    static constexpr pw_registry_events kRegistryEvents{
        .version = PW_VERSION_REGISTRY_EVENTS, .global = appeared, .global_remove = nullptr};
    static constexpr pw_profiler_events kProfilerEvents{.version = PW_VERSION_PROFILER_EVENTS,
                                                        .profile = profiled};

    CycleObserver& observer_;
    pw_loop* loop_;
    pw_context* context_ = nullptr;
    pw_core* core_ = nullptr;
    pw_registry* registry_ = nullptr;
    spa_hook coreHook_{};
    spa_hook registryHook_{};
    std::unique_ptr<Proxy<pw_profiler>> profiler_;
    ObjectID id_ = kNoObject;
    std::size_t bytes_ = 0;
    unsigned looks_ = 0;
    bool hasGone_ = false;
};

const pw_core_events Profiler::Connection::kCoreEvents = [] {
    pw_core_events events{};
    events.version = PW_VERSION_CORE_EVENTS;
    events.error = failed;
    return events;
}();

Profiler::Profiler(const Graph& graph, const Clock& clock, CycleObserver& observer)
    : graph_(graph), clock_(clock), observer_(observer) {}

Profiler::~Profiler() = default;

void Profiler::graphChanged(const GraphEvent& event) {
    if (event.kind == GraphEvent::Kind::node) {
        noteRunning(event.id, event.change != GraphEvent::Change::removed &&
                                  graph_.node(event.id)->state == NodeState::running);
    }
}

void Profiler::noteRunning(ObjectID node, bool isRunning) {
    if (isRunning) {
        const bool isFirst = running_.empty();
        running_.insert(node);
        silentSince_.reset();
        if (isFirst && !due_) {
            due_ = clock_.now().steady;
        }
    } else if (running_.erase(node) != 0 && running_.empty()) {
        silentSince_ = clock_.now().steady;
    }
}

void Profiler::run() {
    const SteadyTime now = clock_.now().steady;
    if (!connection_) {
        connection_ = std::make_unique<Connection>(observer_);
    }
    Connection& connection = *connection_;
    const bool isTooLate = silentSince_ && now - *silentSince_ >= kLinger;
    if (isTooLate || (!connection.isOpen() && silentSince_)) {
        connection.close();
        due_.reset();
        observer_.cyclesRead();
        return;
    }
    if (!connection.isOpen() && !connection.open()) {
        due_ = now + kPause;
        return;
    }
    if (!connection.read() || !connection.mayStillCome()) {
        connection.close();
        due_ = now + kPause;
    } else if (!connection.isBound()) {
        due_ = now + kAnswerInterval;
    } else {
        // When nothing runs, what is left has come with this reading or the next; then only the end is due.
        const bool isOver = silentSince_ && now - *silentSince_ >= kInterval;
        due_ = isOver ? *silentSince_ + kLinger : now + kInterval;
    }
    observer_.cyclesRead();
}

} // namespace tamblo::pipewire
