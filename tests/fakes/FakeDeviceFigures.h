#pragma once

#include "platform/Accessories.h"
#include "platform/ProcessSampling.h"

#include <map>
#include <mutex>
#include <optional>
#include <vector>

namespace tamblo {

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

} // namespace tamblo
