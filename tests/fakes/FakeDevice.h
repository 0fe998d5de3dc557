#pragma once

#include "base/WhileAlive.h"
#include "platform/Platform.h"
#include "platform/RequestTurns.h"

#include <array>
#include <atomic>
#include <chrono>
#include <functional>
#include <map>
#include <mutex>
#include <optional>
#include <string>
#include <string_view>
#include <utility>
#include <variant>
#include <vector>

/// The device, its time, settings and processes, as a test sets them; those who talk to the service, and what
/// it logs.
namespace tamblo {

/// Time that stands still until a test turns it; the time of day begins in March 2026, and may be set alone.
class FakeClock final : public Clock {
public:
    WallTime now() const noexcept override { return now_; }
    WallTime coarseNow() const noexcept override { return now_ - coarseLag; }
    std::chrono::steady_clock::time_point steadyNow() const noexcept override { return steadyNow_; }
    [[nodiscard]] double seconds() const noexcept { return secondsSince1970(now()); }
    std::chrono::seconds utcOffset(WallTime) const override { return offset; }
    void sleepFor(std::chrono::microseconds time) override {
        advance(time);
        whileAsleep();
    }
    void advance(std::chrono::nanoseconds step) noexcept {
        now_ += step;
        steadyNow_ += step;
    }
    void set(WallTime time) noexcept { now_ = time; }

    std::chrono::seconds offset{0};
    std::chrono::milliseconds coarseLag{10};
    std::function<void()> whileAsleep = [] {};

private:
    WallTime now_{std::chrono::seconds(1'772'366'400)};
    std::chrono::steady_clock::time_point steadyNow_{};
};

template <typename Map, typename Key> auto lookUp(const Map& map, const Key& key) {
    const auto found = map.find(key);
    return found != map.end() ? std::optional(found->second) : std::nullopt;
}

class FakeDeviceConditions final : public DeviceConditions {
public:
    int thermalState() const override { return thermal; }
    bool isLowPowerModeEnabled() const override { return lowPower; }

    int thermal = 0;
    bool lowPower = false;
};

class FakeDeviceProperties final : public DeviceProperties {
public:
    std::optional<bool> booleanProperty(std::string_view name) const override {
        return lookUp(properties, name);
    }

    std::map<std::string, bool, std::less<>> properties;
};

class FakePreferences final : public Preferences {
public:
    std::optional<Value> copyPreferenceValue(std::string_view key, std::string_view domain) const override {
        return lookUp(values, std::pair(std::string(domain), std::string(key)));
    }
    void setPreferenceValue(std::string_view key, std::string_view domain, const Value& value) override {
        values[{std::string(domain), std::string(key)}] = value;
    }

    std::map<std::pair<std::string, std::string>, Value> values; ///< by domain and key
};

class FakeProcessInformation final : public ProcessInformation {
public:
    pid_t ownProcessIdentifier() const noexcept override { return 4321; }
    std::optional<std::string> ProcessNameForPid(pid_t pid) const override { return lookUp(names, pid); }
    std::chrono::duration<double> systemUptime() const noexcept override { return uptime; }
    std::chrono::microseconds processorTime() const noexcept override { return consumed; }
    std::variant<std::uint64_t, QueryError> physicalFootprint() const override { return footprint; }
    std::array<double, 3> loadAverages() const override { return {0.5, 0.25, 0.125}; }
    void giveBackMemory() const noexcept override { ++timesGivenBack; }

    std::map<pid_t, std::string> names;
    std::chrono::duration<double> uptime{1000.0};
    std::chrono::microseconds consumed{0};
    mutable int timesGivenBack = 0;
    std::variant<std::uint64_t, QueryError> footprint = std::uint64_t{3} << 20U;
};

class FakeProcessSampling final : public ProcessSampling {
public:
    std::optional<ProcessSample> sample(pid_t pid) const override { return lookUp(samples, pid); }

    std::map<pid_t, ProcessSample> samples;
};

class FakeAccessories final : public Accessories {
public:
    std::vector<Accessory> connectedEarbuds() override {
        ++lookups;
        return earbuds;
    }

    std::vector<Accessory> earbuds;
    int lookups = 0;
};

class FakeTracePoints final : public TracePoints {
public:
    void EmitTracePoint(std::uint32_t traceCode) noexcept override { codes.push_back(traceCode); }

    std::vector<std::uint32_t> codes;
};

/// Channels and failures as a test sets them. What has been gained between two samples is what the later one
/// says: the figures of a channel are those of a difference.
class FakeChanlogFacility final : public ChanlogFacility {
    using Answer = std::variant<ChanlogChannels, int>;

public:
    /// What there is from now on.
    std::vector<ChanlogChannel> channels;
    /// Error codes in place of an answer; none when empty.
    std::optional<int> channelsError;
    std::optional<int> subscribeError;
    std::optional<int> sampleError;
    /// The selections asked for with `channelsOf`, "GROUP-SUBGROUP ", then `s` for each sample, `d` for each
    /// difference; a sampling begins with `|`.
    std::string calls;

    std::unique_ptr<ChanlogSampling> beginSampling() override {
        calls += '|';
        return std::make_unique<Sampling>(*this);
    }
    std::variant<std::unique_ptr<ChanlogSubscription>, int>
    subscribe(const ChanlogSelection& selection, const ChanlogChannels& subscribed) override {
        if (subscribeError) {
            return *subscribeError;
        }
        return std::make_unique<Subscription>(selection, subscribed);
    }
    Answer difference(const ChanlogChannels& earlier, const ChanlogChannels& later) override {
        calls += 'd';
        return earlier == nullptr ? Answer(2) : later;
    }

private:
    struct Subscription final : ChanlogSubscription {
        Subscription(ChanlogSelection chosen, ChanlogChannels found)
            : selection(std::move(chosen)), subscribed(std::move(found)) {}
        const ChanlogChannels& subscribedChannels() const override { return subscribed; }

        ChanlogSelection selection;
        ChanlogChannels subscribed;
    };

    struct Sampling final : ChanlogSampling {
        explicit Sampling(FakeChanlogFacility& owner) : facility(owner) {}
        Answer channelsOf(const ChanlogSelection& selection) override {
            facility.calls +=
                selection.groupName.value_or("") + "-" + selection.subGroupName.value_or("") + " ";
            return facility.select(selection, facility.channelsError);
        }
        Answer sample(ChanlogSubscription& subscription) override {
            facility.calls += 's';
            return facility.select(static_cast<Subscription&>(subscription).selection, facility.sampleError);
        }

        FakeChanlogFacility& facility;
    };

    [[nodiscard]] Answer select(const ChanlogSelection& selection, std::optional<int> error) const {
        if (error) {
            return *error;
        }
        auto selected = std::make_shared<std::vector<ChanlogChannelRef>>();
        for (const ChanlogChannel& channel : channels) {
            if ((!selection.groupName || channel.groupName == selection.groupName) &&
                (!selection.subGroupName || channel.subGroupName == selection.subGroupName)) {
                selected->push_back(std::make_shared<const ChanlogChannel>(channel));
            }
        }
        return selected;
    }
};

/// Notifications that a test posts; the handlers run when the test runs their queue.
class FakeNamedNotifications final : public NamedNotifications {
public:
    Registration RegisterNamedNotification(std::string_view name, SerialQueue& queue,
                                           Handler handler) override {
        registered_[++lastToken_] =
            std::make_shared<Registered>(std::string(name), queue, std::move(handler));
        return {0, lastToken_};
    }
    State GetNamedNotificationState(int token) override {
        const auto found = registered_.find(token);
        const auto word = found != registered_.end() ? lookUp(words_, found->second->name) : std::nullopt;
        return word ? State{0, *word} : State{1, 0};
    }
    int PostNamedNotification(std::string_view name) override {
        posted.emplace_back(name);
        post(posted.back(), words_[posted.back()]);
        return 0;
    }
    void CancelNamedNotification(int token) override { registered_.erase(token); }

    void post(const std::string& name, std::uint64_t word) {
        words_[name] = word;
        for (const auto& [token, registration] : registered_) {
            if (registration->name == name) {
                const auto call = [which = token](Registered& called) { called.handler(which); };
                registration->queue.post(whileAlive(std::weak_ptr(registration), call), Pace::mayBlock);
            }
        }
    }
    [[nodiscard]] std::size_t registrationCount() const noexcept { return registered_.size(); }

    /// The names that the service itself has posted.
    std::vector<std::string> posted;

private:
    struct Registered {
        std::string name;
        SerialQueue& queue;
        Handler handler;
    };

    std::map<int, std::shared_ptr<Registered>> registered_;
    std::map<std::string, std::uint64_t> words_;
    int lastToken_ = 0;
};

/// One connection whose client is the test: calls the exported object, breaks off, ends.
class FakeClientConnection final : public ClientConnection {
public:
    FakeClientConnection(const ClientIdentity& peer, RequestTurns& turns)
        : peer_(peer), requests_(turns.makeQueue(peer, [] {})) {}

    ClientIdentity peer() const noexcept override { return peer_; }
    bool isPeerThere() const noexcept override { return true; }
    const std::shared_ptr<RequestQueue>& requestQueue() const noexcept override { return requests_; }
    void setExportedObject(std::shared_ptr<ZRReportingServiceProtocol> object) override {
        object_ = std::move(object);
    }
    void setInterruptionHandler(UniqueFunction<void()> handler) override {
        interruption_ = std::move(handler);
    }
    void setInvalidationHandler(UniqueFunction<void()> handler) override {
        invalidation_ = std::move(handler);
    }
    void resume() override {}
    std::string description() const override { return "connection of " + std::to_string(peer_.process); }

    [[nodiscard]] ZRReportingServiceProtocol& object() const noexcept { return *object_; }
    void interrupt() { interruption_(); }
    /// Ends the connection for good; it lets go of the exported object afterwards.
    void invalidate() {
        invalidation_();
        object_.reset();
    }
    void dropObject() { object_.reset(); }

private:
    const ClientIdentity peer_;
    const std::shared_ptr<RequestQueue> requests_;
    std::shared_ptr<ZRReportingServiceProtocol> object_;
    UniqueFunction<void()> interruption_;
    UniqueFunction<void()> invalidation_;
};

/// A listener that tests connect to.
class FakeConnectionService final : public ConnectionService, private ConnectionListener {
public:
    ConnectionListener& listenerForServiceName(std::string_view) override { return *this; }

    /// A new client, or null when it is turned away or nobody listens.
    [[nodiscard]] std::unique_ptr<FakeClientConnection> connect(const ClientIdentity& peer,
                                                                RequestTurns& turns) {
        auto connection = std::make_unique<FakeClientConnection>(peer, turns);
        const bool isAccepted = isResumed_ && delegate_->shouldAcceptNewConnection(*connection);
        return isAccepted ? std::move(connection) : nullptr;
    }

private:
    void setDelegate(ListenerDelegate& delegate) override { delegate_ = &delegate; }
    void resume() override { isResumed_ = true; }

    ListenerDelegate* delegate_ = nullptr;
    bool isResumed_ = false;
};

/// Keeps every line, taken apart.
class FakeLog final : public StructuredLog {
public:
    struct Line {
        LogLevel level;
        std::string category;
        std::string prefix; ///< source unit, colon, line number and blank
        std::string text;
    };

    LogLevel threshold(std::string_view) const noexcept override { return threshold_; }
    void write(LogLevel level, std::string_view categoryCode, std::string_view line) noexcept override {
        // "%25s:%-5d ": the text begins after the blank that follows the number and its padding.
        const std::size_t colon = line.find(':');
        std::size_t text = line.find(' ', colon);
        text = text < colon + 6 ? colon + 7 : text + 1;
        const std::lock_guard held(mutex_);
        lines_.push_back({level, std::string(categoryCode), std::string(line.substr(0, text)),
                          std::string(line.substr(text))});
    }

    /// What each category is told when the context is made.
    void setThreshold(LogLevel level) noexcept { threshold_ = level; }
    [[nodiscard]] std::vector<Line> lines() const {
        const std::lock_guard held(mutex_);
        return lines_;
    }
    /// The texts that begin so, in order.
    [[nodiscard]] std::vector<std::string> texts(std::string_view beginning = {}) const {
        std::vector<std::string> found;
        for (const Line& line : lines()) {
            if (line.text.starts_with(beginning)) {
                found.push_back(line.text);
            }
        }
        return found;
    }
    [[nodiscard]] std::size_t count(std::string_view beginning) const { return texts(beginning).size(); }
    /// The lines since the last call, as `LEVEL CODE TEXT` with the level as a digit.
    [[nodiscard]] std::vector<std::string> take() {
        std::vector<std::string> taken;
        const std::lock_guard held(mutex_);
        for (const Line& line : lines_) {
            taken.push_back(std::to_string(static_cast<int>(line.level)) + " " + line.category + " " +
                            line.text);
        }
        lines_.clear();
        return taken;
    }
    void clear() { (void)take(); }

private:
    std::atomic<LogLevel> threshold_{LogLevel::debug};
    mutable std::mutex mutex_;
    std::vector<Line> lines_;
};

} // namespace tamblo
