#pragma once

#include "platform/Accessories.h"
#include "platform/ChanlogFacility.h"
#include "platform/ConnectionService.h"
#include "platform/DeviceConditions.h"
#include "platform/DeviceProperties.h"
#include "platform/NamedNotifications.h"
#include "platform/Preferences.h"
#include "platform/ProcessInformation.h"
#include "platform/ProcessSampling.h"
#include "platform/StructuredLog.h"
#include "platform/TracePoints.h"

#include <array>
#include <atomic>
#include <map>
#include <mutex>
#include <optional>
#include <string>
#include <string_view>
#include <utility>
#include <variant>
#include <vector>

/// The device, its settings and processes, as a test sets them; those who talk to the service, and what it
/// logs.
namespace tamblo {

template <typename Map, typename Key> auto lookUp(const Map& map, const Key& key) {
    const auto found = map.find(key);
    return found != map.end() ? std::optional(found->second) : std::nullopt;
}

class FakeDeviceConditions final : public DeviceConditions {
public:
    [[nodiscard]] int thermalState() const override { return thermal; }
    [[nodiscard]] bool isLowPowerModeEnabled() const override { return lowPower; }

    int thermal = 0;
    bool lowPower = false;
};

class FakeDeviceProperties final : public DeviceProperties {
public:
    [[nodiscard]] std::optional<bool> booleanProperty(std::string_view name) const override {
        return lookUp(properties_, name);
    }
    void set(const std::string& name, bool value) { properties_[name] = value; }

private:
    std::map<std::string, bool, std::less<>> properties_;
};

class FakePreferences final : public Preferences {
public:
    [[nodiscard]] std::optional<Value> copyPreferenceValue(std::string_view key,
                                                           std::string_view domain) const override {
        return lookUp(values_, std::pair(std::string(domain), std::string(key)));
    }
    void setPreferenceValue(std::string_view key, std::string_view domain, const Value& value) override {
        set(std::string(key), std::string(domain), value);
    }
    void set(const std::string& key, const std::string& domain, Value value) {
        values_[{domain, key}] = std::move(value);
    }
    void remove(const std::string& key, const std::string& domain) { values_.erase({domain, key}); }

private:
    std::map<std::pair<std::string, std::string>, Value> values_;
};

class FakeProcessInformation final : public ProcessInformation {
public:
    [[nodiscard]] pid_t ownProcessIdentifier() const noexcept override { return own; }
    [[nodiscard]] std::optional<std::string> ProcessNameForPid(pid_t pid) const override {
        return lookUp(names, pid);
    }
    [[nodiscard]] std::chrono::duration<double> systemUptime() const noexcept override { return uptime; }
    [[nodiscard]] std::chrono::microseconds processorTime() const noexcept override { return consumed; }

    [[nodiscard]] std::variant<std::uint64_t, QueryError> physicalFootprint() const override {
        return footprint;
    }
    [[nodiscard]] std::array<double, 3> loadAverages() const override { return loads; }

    pid_t own = 4321;
    std::map<pid_t, std::string> names;
    std::chrono::duration<double> uptime{1000.0};
    std::chrono::microseconds consumed{0};
    std::variant<std::uint64_t, QueryError> footprint = std::uint64_t{3} << 20U;
    std::array<double, 3> loads{0.5, 0.25, 0.125};
};

class FakeProcessSampling final : public ProcessSampling {
public:
    [[nodiscard]] std::optional<ProcessSample> sample(pid_t pid) const override {
        return lookUp(samples_, pid);
    }
    void set(pid_t pid, const ProcessSample& sample) { samples_[pid] = sample; }
    void end(pid_t pid) { samples_.erase(pid); }

private:
    std::map<pid_t, ProcessSample> samples_;
};

class FakeAccessories final : public Accessories {
public:
    [[nodiscard]] std::vector<Accessory> connectedEarbuds() override {
        ++lookups;
        return earbuds;
    }

    std::vector<Accessory> earbuds;
    int lookups = 0;
};

class FakeTracePoints final : public TracePoints {
public:
    void EmitTracePoint(std::uint32_t traceCode) noexcept override { codes_.push_back(traceCode); }
    /// The codes since the last call.
    [[nodiscard]] std::vector<std::uint32_t> take() { return std::exchange(codes_, {}); }

private:
    std::vector<std::uint32_t> codes_;
};

/// Channels and failures as a test sets them. What has been gained between two samples is what the later one
/// says: the figures of a channel are those of a difference.
class FakeChanlogFacility final : public ChanlogFacility {
public:
    /// What there is from now on.
    std::vector<ChanlogChannel> channels;
    /// Error codes in place of an answer; none when empty. 0 is a failure without a code.
    std::optional<int> channelsError;
    std::optional<int> subscribeError;
    std::optional<int> sampleError;
    /// The selections asked for with `channelsOf`, "GROUP-SUBGROUP ", then `s` for each sample, `d` for each
    /// difference; a sampling begins with `|`.
    std::string calls;

    [[nodiscard]] std::unique_ptr<ChanlogSampling> beginSampling() override {
        calls += '|';
        return std::make_unique<Sampling>(*this);
    }
    [[nodiscard]] std::variant<std::unique_ptr<ChanlogSubscription>, int>
    subscribe(const ChanlogSelection& selection, const ChanlogChannels& subscribed) override {
        if (subscribeError) {
            return *subscribeError;
        }
        return std::make_unique<Subscription>(selection, subscribed);
    }
    [[nodiscard]] std::variant<ChanlogChannels, int> difference(const ChanlogChannels& earlier,
                                                                const ChanlogChannels& later) override {
        calls += 'd';
        constexpr int kNoEarlierSample = 2;
        if (earlier == nullptr) {
            return kNoEarlierSample;
        }
        return later;
    }

private:
    struct Subscription final : ChanlogSubscription {
        Subscription(ChanlogSelection chosen, ChanlogChannels found)
            : selection(std::move(chosen)), subscribed(std::move(found)) {}
        [[nodiscard]] const ChanlogChannels& subscribedChannels() const override { return subscribed; }

        ChanlogSelection selection;
        ChanlogChannels subscribed;
    };

    struct Sampling final : ChanlogSampling {
        explicit Sampling(FakeChanlogFacility& owner) : facility(owner) {}
        [[nodiscard]] std::variant<ChanlogChannels, int>
        channelsOf(const ChanlogSelection& selection) override {
            facility.calls +=
                selection.groupName.value_or("") + "-" + selection.subGroupName.value_or("") + " ";
            if (facility.channelsError) {
                return *facility.channelsError;
            }
            return facility.select(selection);
        }
        [[nodiscard]] std::variant<ChanlogChannels, int> sample(ChanlogSubscription& subscription) override {
            facility.calls += 's';
            if (facility.sampleError) {
                return *facility.sampleError;
            }
            return facility.select(static_cast<Subscription&>(subscription).selection);
        }

        FakeChanlogFacility& facility;
    };

    [[nodiscard]] ChanlogChannels select(const ChanlogSelection& selection) const {
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
    [[nodiscard]] Registration RegisterNamedNotification(std::string_view name, SerialQueue& queue,
                                                         Handler handler) override {
        if (registrationStatus != 0) {
            return {registrationStatus, 0};
        }
        registered_[++lastToken_] = {std::string(name), &queue,
                                     std::make_shared<Handler>(std::move(handler))};
        return {0, lastToken_};
    }
    [[nodiscard]] State GetNamedNotificationState(int token) override {
        const auto found = registered_.find(token);
        const auto word = found != registered_.end() ? words_.find(found->second.name) : words_.end();
        return word != words_.end() ? State{0, word->second} : State{kNoState, 0};
    }
    [[nodiscard]] int PostNamedNotification(std::string_view name) override {
        posted.emplace_back(name);
        post(posted.back(), words_[posted.back()]);
        return 0;
    }
    void CancelNamedNotification(int token) override { registered_.erase(token); }

    void post(const std::string& name, std::uint64_t word) {
        words_[name] = word;
        for (const auto& [token, registration] : registered_) {
            if (registration.name == name) {
                registration.queue->post([this, which = token] { call(which); }, Pace::mayBlock);
            }
        }
    }
    [[nodiscard]] std::size_t registrationCount() const noexcept { return registered_.size(); }

    /// The names that the service itself has posted.
    std::vector<std::string> posted;
    /// What registering answers; other than 0, it fails.
    int registrationStatus = 0;

private:
    static constexpr int kNoState = 1;

    struct Registered {
        std::string name;
        SerialQueue* queue;
        std::shared_ptr<Handler> handler;
    };

    void call(int token) {
        const auto found = registered_.find(token);
        if (found != registered_.end()) {
            const auto handler = found->second.handler;
            (*handler)(token);
        }
    }

    std::map<int, Registered> registered_;
    std::map<std::string, std::uint64_t> words_;
    int lastToken_ = 0;
};

/// One connection whose client is the test: calls the exported object, breaks off, ends.
class FakeClientConnection final : public ClientConnection {
public:
    explicit FakeClientConnection(pid_t pid) : pid_(pid) {}

    [[nodiscard]] pid_t peerProcessIdentifier() const noexcept override { return pid_; }
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
    [[nodiscard]] std::string description() const override { return "connection of " + std::to_string(pid_); }

    [[nodiscard]] ZRReportingServiceProtocol& object() const noexcept { return *object_; }
    void interrupt() { interruption_(); }
    /// Ends the connection for good; it lets go of the exported object afterwards.
    void invalidate() {
        invalidation_();
        object_.reset();
    }
    void dropObject() { object_.reset(); }

private:
    const pid_t pid_;
    std::shared_ptr<ZRReportingServiceProtocol> object_;
    UniqueFunction<void()> interruption_;
    UniqueFunction<void()> invalidation_;
};

/// A listener that tests connect to.
class FakeConnectionService final : public ConnectionService, private ConnectionListener {
public:
    [[nodiscard]] ConnectionListener& listenerForServiceName(std::string_view) override { return *this; }

    /// A new client, or null when it is turned away or nobody listens.
    [[nodiscard]] std::unique_ptr<FakeClientConnection> connect(pid_t pid) {
        auto connection = std::make_unique<FakeClientConnection>(pid);
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

    [[nodiscard]] LogLevel threshold(std::string_view) const noexcept override { return threshold_; }
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
    void clear() {
        const std::lock_guard held(mutex_);
        lines_.clear();
    }

private:
    std::atomic<LogLevel> threshold_{LogLevel::debug};
    mutable std::mutex mutex_;
    std::vector<Line> lines_;
};

} // namespace tamblo
