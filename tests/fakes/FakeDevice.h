#pragma once

#include "platform/Accessories.h"
#include "platform/DeviceConditions.h"
#include "platform/DeviceProperties.h"
#include "platform/Preferences.h"
#include "platform/ProcessInformation.h"
#include "platform/ProcessSampling.h"
#include "platform/TracePoints.h"

#include <array>
#include <chrono>
#include <cstdint>
#include <map>
#include <mutex>
#include <optional>
#include <string>
#include <string_view>
#include <utility>
#include <variant>
#include <vector>

/// The device, its settings and processes, as a test sets them.
namespace tamblo {

/// Conditions that a test sets.
class FakeDeviceConditions final : public DeviceConditions {
public:
    [[nodiscard]] int thermalState() const override { return thermal; }
    [[nodiscard]] bool isLowPowerModeEnabled() const override { return lowPower; }

    int thermal = 0;
    bool lowPower = false;
};

/// The properties that a test has set.
class FakeDeviceProperties final : public DeviceProperties {
public:
    [[nodiscard]] std::optional<bool> booleanProperty(std::string_view name) const override {
        const auto found = properties_.find(name);
        return found != properties_.end() ? std::optional(found->second) : std::nullopt;
    }
    void set(const std::string& name, bool value) { properties_[name] = value; }

private:
    std::map<std::string, bool, std::less<>> properties_;
};

/// The preferences that a test has set.
class FakePreferences final : public Preferences {
public:
    [[nodiscard]] std::optional<Value> copyPreferenceValue(std::string_view key,
                                                           std::string_view domain) const override {
        const auto found = values_.find({std::string(domain), std::string(key)});
        return found != values_.end() ? std::optional(found->second) : std::nullopt;
    }
    void setPreferenceValue(std::string_view key, std::string_view domain, const Value& value,
                            Work afterwards) override {
        set(std::string(key), std::string(domain), value);
        if (afterwards) {
            afterwards();
        }
    }
    void set(const std::string& key, const std::string& domain, Value value) {
        values_[{domain, key}] = std::move(value);
    }
    void remove(const std::string& key, const std::string& domain) { values_.erase({domain, key}); }

private:
    std::map<std::pair<std::string, std::string>, Value> values_;
};

/// Figures that a test sets.
class FakeProcessInformation final : public ProcessInformation {
public:
    [[nodiscard]] pid_t ownProcessIdentifier() const noexcept override { return own; }
    [[nodiscard]] std::optional<std::string> ProcessNameForPid(pid_t pid) const override {
        const auto found = names.find(pid);
        return found != names.end() ? std::optional(found->second) : std::nullopt;
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

/// Figures that a test sets, by process.
class FakeProcessSampling final : public ProcessSampling {
public:
    [[nodiscard]] std::optional<ProcessSample> sample(pid_t pid) const override {
        const std::lock_guard lock(mutex_);
        const auto found = samples_.find(pid);
        return found != samples_.end() ? std::optional(found->second) : std::nullopt;
    }
    void set(pid_t pid, const ProcessSample& sample) {
        const std::lock_guard lock(mutex_);
        samples_[pid] = sample;
    }
    void end(pid_t pid) {
        const std::lock_guard lock(mutex_);
        samples_.erase(pid);
    }

private:
    mutable std::mutex mutex_;
    std::map<pid_t, ProcessSample> samples_;
};

/// Accessories that a test sets.
class FakeAccessories final : public Accessories {
public:
    [[nodiscard]] std::vector<Accessory> connectedEarbuds() override {
        ++lookups;
        return earbuds;
    }

    std::vector<Accessory> earbuds;
    int lookups = 0;
};

/// Keeps every trace code.
class FakeTracePoints final : public TracePoints {
public:
    void EmitTracePoint(std::uint32_t traceCode) noexcept override {
        const std::lock_guard held(mutex_);
        codes_.push_back(traceCode);
    }
    /// The codes since the last call.
    [[nodiscard]] std::vector<std::uint32_t> take() {
        const std::lock_guard held(mutex_);
        return std::exchange(codes_, {});
    }

private:
    std::mutex mutex_;
    std::vector<std::uint32_t> codes_;
};

} // namespace tamblo
