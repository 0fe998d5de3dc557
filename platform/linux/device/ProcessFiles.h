#pragma once

#include "platform/ProcessSampling.h"

#include <cstddef>
#include <cstdint>
#include <optional>
#include <string>
#include <string_view>
#include <variant>
#include <vector>

#include <sys/types.h>

namespace tamblo {

/// What the kernel tells of processes and of itself in `/proc`, or in a directory made like it. Holds nothing
/// but the directory's name and reads it anew at every call; any thread, and waits for nothing but the
/// kernel.
///
/// A process or thread may end between any two calls, and while one reads: the answer is then nothing. So it
/// is for what the service may not look at. Texts are always UTF-8, whatever a process calls itself.
class ProcessFiles {
public:
    /// How many threads of a process are looked at; some hundred are a lot.
    static constexpr std::size_t kMaximumThreads = 4096;

    /// What a thread was doing at one moment.
    struct ThreadSample {
        std::string state;                      ///< as the kernel words it: "S (sleeping)"
        std::optional<std::string> waitChannel; ///< the kernel's function that it waits in, if it does
        /// From the innermost call outwards, as "futex_wait+0x66/0x120"; nothing where the service may not
        /// see it.
        std::optional<std::vector<std::string>> kernelStack;

        [[nodiscard]] bool operator==(const ThreadSample&) const = default;
    };

    /// What memory a process holds, in bytes.
    struct Memory {
        std::uint64_t resident = 0;
        std::uint64_t peakResident = 0;
        /// Resident, as `file` and `shared`; nothing where the kernel does not tell.
        std::optional<std::uint64_t> anonymous;
        std::uint64_t file = 0;
        std::uint64_t shared = 0;
        std::uint64_t swapped = 0;
        std::uint64_t locked = 0;
        std::uint64_t pageTables = 0;
        std::uint64_t threads = 0; ///< a count
    };

    /// What memory the kernel holds, in bytes. What it does not tell is 0.
    struct KernelMemory {
        std::uint64_t unevictable = 0;
        std::uint64_t locked = 0;
        std::uint64_t slab = 0;
        std::uint64_t slabReclaimable = 0;
        std::uint64_t slabUnreclaimable = 0;
        std::uint64_t pageTables = 0;
        std::uint64_t kernelStack = 0;
    };

    explicit ProcessFiles(std::string root = "/proc") : root_(std::move(root)) {}

    /// At most 15 bytes, as the kernel keeps it.
    [[nodiscard]] std::optional<std::string> name(pid_t pid) const;
    /// The identifiers of the process's threads, the first `limit` of them.
    [[nodiscard]] std::vector<pid_t> threads(pid_t pid, std::size_t limit = kMaximumThreads) const;
    [[nodiscard]] std::optional<std::string> threadName(pid_t pid, pid_t thread) const;
    [[nodiscard]] std::optional<ThreadSample> sampleThread(pid_t pid, pid_t thread) const;
    /// Switches are those of the threads that there are: the kernel keeps none of those that have ended, so
    /// that they may run backwards.
    [[nodiscard]] std::optional<ProcessSample> sample(pid_t pid) const;
    /// Nothing, too, for a process that has no memory of its own: one of the kernel's, or one that has ended
    /// and is not yet waited for.
    [[nodiscard]] std::optional<Memory> memory(pid_t pid) const;
    /// The service's own, or an `errno`: `ENODATA` where the kernel tells nothing of it.
    [[nodiscard]] std::variant<Memory, int> ownMemory() const;
    [[nodiscard]] std::optional<KernelMemory> kernelMemory() const;

private:
    [[nodiscard]] std::string pathOf(pid_t pid, std::string_view file) const;
    [[nodiscard]] std::string pathOf(pid_t pid, pid_t thread, std::string_view file) const;
    void addSwitches(pid_t pid, ProcessSample& sample) const;

    const std::string root_;
};

} // namespace tamblo
