#pragma once

#include "base/Dictionary.h"

#include <cstddef>
#include <cstdint>
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
    /// Processes of a list that is not told how many: more than play and record on a device at a time, and
    /// not so many that reading several of the kernel's files for each holds up a queue.
    static constexpr std::size_t kMaximum = 64;
    /// Elements of a payload's array that are looked at, whatever the list has room for: it is a client that
    /// decides how many there are, and a handful of processes takes part in what it reports.
    static constexpr std::size_t kMaximumNamed = 64;

    explicit ProcessList(std::size_t maximum = kMaximum) : maximum_(maximum) {}

    void add(std::span<const pid_t> processes);
    /// Those that the payload names under `kProcessIDs`. What is no identifier of a process is left out, and
    /// of an array only the beginning counts.
    void addNamedBy(const Dictionary& payload);
    /// Of what was added, what is not in the list: what is beyond, or no identifier of a process.
    [[nodiscard]] std::size_t leftOut() const noexcept { return leftOut_; }
    [[nodiscard]] std::vector<pid_t> take() && noexcept { return std::move(processes_); }

private:
    void add(std::int64_t process);

    const std::size_t maximum_;
    std::vector<pid_t> processes_;
    std::size_t leftOut_ = 0;
};

} // namespace tamblo
