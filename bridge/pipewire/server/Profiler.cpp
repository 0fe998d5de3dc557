#include "bridge/pipewire/server/Profiler.h"

#include "bridge/pipewire/server/Context.h"
#include "bridge/pipewire/server/Cycles.h"
#include "bridge/pipewire/server/Proxy.h"
#include "os/FileDescriptor.h"
#include "os/LocalAddress.h"

#include <algorithm>
#include <array>
#include <cerrno>
#include <cstddef>
#include <cstdio>
#include <cstring>
#include <new>
#include <span>
#include <stdexcept>
#include <string>
#include <utility>

#include <pipewire/extensions/profiler.h>
#include <pipewire/pipewire.h>
#include <sys/ioctl.h>
#include <sys/socket.h>

namespace tamblo::pipewire {

using std::chrono::milliseconds;

namespace {

constexpr std::array<const char*, 2> kModules{"libpipewire-module-protocol-native",
                                              "libpipewire-module-profiler"};

/// The server's answers to a new connection: looked for this often, so many times.
constexpr milliseconds kAnswerInterval{20};
constexpr unsigned kMostAnswers = 50;

/// A connection of which it can be told how much waits in it, as the library tells that of none. -1 when
/// nobody answers.
int connectedSocket(const std::string& path) noexcept {
    const auto address = LocalAddress::of(path);
    FileDescriptor socket(::socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC | SOCK_NONBLOCK, 0));
    const bool isConnected =
        address && socket.isOpen() && ::connect(socket.get(), address->get(), address->size()) == 0;
    return isConnected ? socket.release() : -1;
}

} // namespace

class Profiler::Connection {
public:
    explicit Connection(std::span<CycleObserver* const> observers)
        : observers_(observers), loop_(pw_loop_new(nullptr)) {
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
    /// Whether the server has told of its profiler; while it has not, `mayStillCome` tells whether it is
    /// worth to look again.
    [[nodiscard]] bool isFound() const noexcept { return id_ != kNoObject; }
    [[nodiscard]] bool mayStillCome() noexcept { return isFound() || ++looks_ < kMostAnswers; }

    bool open(const std::string& socketPath) {
        socket_ = connectedSocket(socketPath);
        // The library closes the socket with the connection.
        core_ = socket_ < 0 ? nullptr : pw_context_connect_fd(context_, socket_, nullptr, 0);
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
        spa_hook_remove(&registryHook_);
        pw_proxy_destroy(reinterpret_cast<pw_proxy*>(std::exchange(registry_, nullptr)));
        spa_hook_remove(&coreHook_);
        pw_core_disconnect(std::exchange(core_, nullptr));
        id_ = kNoObject;
    }

    /// Has what came be told; false when the server has gone.
    [[nodiscard]] bool read() {
        bytes_ = 0;
        int waiting = 0;
        (void)::ioctl(socket_, FIONREAD, &waiting);
        iterate();
        bytes_ = std::max(bytes_, static_cast<std::size_t>(std::max(waiting, 0)));
        return !hasGone_;
    }
    /// How much the last `read` read.
    [[nodiscard]] std::size_t bytes() const noexcept { return bytes_; }

    [[nodiscard]] bool isAsking() const noexcept { return profiler_ != nullptr; }
    void ask() {
        profiler_ = std::make_unique<Proxy<pw_profiler>>(registry_, id_, PW_TYPE_INTERFACE_Profiler,
                                                         PW_VERSION_PROFILER);
        if (profiler_->get() != nullptr) {
            pw_profiler_add_listener(profiler_->get(), profiler_->hook(), &kProfilerEvents, this);
        }
        iterate();
    }
    void askNoMore() {
        profiler_.reset();
        iterate();
    }

private:
    /// Receives what has come, and sends what is to leave.
    void iterate() {
        constexpr int kMostRounds = 16;
        pw_loop_enter(loop_);
        for (int round = 0; round < kMostRounds && pw_loop_iterate(loop_, 0) > 0; ++round) {
        }
        pw_loop_leave(loop_);
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
        readCycles(profile, self.observers_);
    }
    static const pw_core_events kCoreEvents;
    static constexpr pw_registry_events kRegistryEvents{
        .version = PW_VERSION_REGISTRY_EVENTS, .global = appeared, .global_remove = nullptr};
    static constexpr pw_profiler_events kProfilerEvents{.version = PW_VERSION_PROFILER_EVENTS,
                                                        .profile = profiled};

    const std::span<CycleObserver* const> observers_;
    pw_loop* loop_;
    pw_context* context_ = nullptr;
    pw_core* core_ = nullptr;
    pw_registry* registry_ = nullptr;
    spa_hook coreHook_{};
    spa_hook registryHook_{};
    std::unique_ptr<Proxy<pw_profiler>> profiler_;
    ObjectID id_ = kNoObject;
    int socket_ = -1;
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

Profiler::Profiler(const Graph& graph, const Clock& clock, std::vector<CycleObserver*> observers,
                   std::string socketPath)
    : graph_(graph), clock_(clock), observers_(std::move(observers)), socketPath_(std::move(socketPath)) {}

Profiler::~Profiler() = default;

void Profiler::graphChanged(const GraphEvent& event) {
    if (event.kind == GraphEvent::Kind::node) {
        noteRunning(event.id, event.change != GraphEvent::Change::removed &&
                                  graph_.node(event.id)->state == NodeState::running);
    } else if (event.kind == GraphEvent::Kind::server && graph_.server().version.empty()) {
        // The next server is another connection's.
        if (connection_) {
            connection_->close();
        }
        due_.reset();
    }
}

void Profiler::noteRunning(ObjectID node, bool isRunning) {
    if (isRunning) {
        const bool isFirst = running_.empty();
        running_.insert(node);
        silentSince_.reset();
        if (connection_ && connection_->isAsking() && running_.size() >= runningThen_ + kManyMore) {
            due_ = clock_.now().steady;
        }
        if (isFirst && !isMissing_) {
            const bool isOpen = connection_ && connection_->isOpen();
            due_ = clock_.now().steady + (isOpen ? kInterval : std::chrono::seconds{0});
        }
    } else if (running_.erase(node) != 0 && running_.empty()) {
        silentSince_ = clock_.now().steady;
    }
}

/// A library without the module for it is one that goes without profiling, too.
bool Profiler::makeConnection() {
    try {
        connection_ = std::make_unique<Connection>(observers_);
    } catch (const std::runtime_error& problem) {
        isMissing_ = true;
        std::fprintf(stderr, "tamblo-pipewire: overloads are not seen: %s\n", problem.what());
    }
    return connection_ != nullptr;
}

void Profiler::tellRead() {
    for (CycleObserver* const observer : observers_) {
        observer->cyclesRead();
    }
}

/// After a look: how long until the next one.
std::chrono::nanoseconds Profiler::askOrPause(SteadyTime now) {
    const std::chrono::nanoseconds passed = now - std::exchange(lookedAt_, now);
    runningThen_ = running_.size();
    if (!connection_->isAsking()) {
        connection_->ask();
        return window_;
    }
    const double share = static_cast<double>(kGoodAtOnce) / static_cast<double>(connection_->bytes() + 1);
    const std::chrono::duration<double> good = passed * std::min(share, 1000.0);
    window_ = std::clamp<std::chrono::nanoseconds>(std::chrono::duration_cast<std::chrono::nanoseconds>(good),
                                                   kShortestWindow, kInterval);
    if (window_ == kInterval) {
        return kInterval;
    }
    // What of it the server still has would be read at the next look, and those after it, and the library's
    // buffer become larger each time.
    if (connection_->bytes() > kMostAtOnce) {
        connection_->close();
    } else {
        connection_->askNoMore();
    }
    return 2 * kInterval - window_;
}

void Profiler::run() {
    const SteadyTime now = clock_.now().steady;
    if (!connection_ && !makeConnection()) {
        due_.reset();
        return;
    }
    Connection& connection = *connection_;
    const bool isTooLate = silentSince_ && now - *silentSince_ >= kLinger;
    if (isTooLate || (!connection.isOpen() && silentSince_)) {
        connection.close();
        due_.reset();
        tellRead();
        return;
    }
    if (!connection.isOpen() && !connection.open(socketPath_)) {
        due_ = now + kPause;
        return;
    }
    const bool goesOn = connection.read() && connection.mayStillCome();
    tellRead();
    // From now on: what was reported of this reading was so long ago at the next.
    const SteadyTime end = clock_.now().steady;
    if (!goesOn) {
        connection.close();
        due_ = end + kPause;
    } else if (!connection.isFound()) {
        due_ = end + kAnswerInterval;
    } else {
        // When nothing runs, what is left has come with this reading or the next; then only the end is due.
        const std::chrono::nanoseconds next = askOrPause(end);
        const bool isOver = silentSince_ && now - *silentSince_ >= kInterval;
        due_ = isOver ? *silentSince_ + kLinger : end + next;
    }
}

} // namespace tamblo::pipewire
