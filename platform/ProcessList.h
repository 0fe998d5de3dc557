#pragma once

#include "base/Dictionary.h"

#include <algorithm>
#include <cstddef>
#include <cstdint>
#include <limits>
#include <span>
#include <string_view>
#include <utility>
#include <vector>

#include <sys/types.h>

namespace tamblo {

/// The key under which a payload names processes: a number, or an array of numbers.
inline constexpr std::string_view kProcessIDs = "processIDs";

/// Processes that somebody asks to have looked at, each once, in the order in which they were added. Only as
/// many as are looked at in a moment; those beyond are left out.
class ProcessList {
public:
    static constexpr std::size_t kMaximum = 64;

    explicit ProcessList(std::size_t maximum = kMaximum) : maximum_(maximum) {}

    void add(std::span<const pid_t> processes) {
        for (const pid_t process : processes) {
            add(process);
        }
    }
    /// Those that the payload names under `kProcessIDs`. What is no identifier of a process is left out, and
    /// of an array, as of a list, only the beginning counts.
    void addNamedBy(const Dictionary& payload) {
        const Value* const named = payload.find(kProcessIDs);
        if (named == nullptr) {
            return;
        }
        const std::span<const Value> elements = named->isArray() ? named->arrayValue() : std::span(named, 1);
        for (const Value& element : elements.first(std::min(elements.size(), kMaximum))) {
            if (element.isNumber() && element.kind() != Value::Kind::boolean) {
                add(element.integerValue());
            }
        }
    }
    [[nodiscard]] std::vector<pid_t> take() && noexcept { return std::move(processes_); }

private:
    void add(std::int64_t process) {
        if (process <= 0 || process > std::numeric_limits<pid_t>::max() || processes_.size() == maximum_) {
            return;
        }
        const auto identifier = static_cast<pid_t>(process);
        if (std::find(processes_.begin(), processes_.end(), identifier) == processes_.end()) {
            processes_.push_back(identifier);
        }
    }

    const std::size_t maximum_;
    std::vector<pid_t> processes_;
};

} // namespace tamblo
