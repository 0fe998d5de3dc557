#pragma once

#include <chrono>
#include <cstddef>
#include <cstdint>

#include <sched.h>
#include <sys/types.h>

/// What the kernel knows of a process or a thread, and where it runs. Each throws `std::system_error` when
/// the kernel does not answer.
namespace tamblo::bench {

/// The processor that the driving side runs on, and the one for the service when each has its own. The same
/// one on a machine that has only one.
/// In place of a processor: wherever the scheduler likes.
inline constexpr int kAnyProcessor = -1;
[[nodiscard]] int clientProcessor();
[[nodiscard]] int serviceProcessor();
/// The set of that one processor, or of all that this process was given.
[[nodiscard]] cpu_set_t processorSet(int processor);
void pinThisThread(int processor);

[[nodiscard]] std::chrono::nanoseconds cpuTimeOfThisThread();
/// Of all the process's threads.
[[nodiscard]] std::chrono::nanoseconds cpuTimeOf(pid_t process);

/// Exact, which the counters of /proc/PID/status are not.
[[nodiscard]] std::size_t residentBytesOf(pid_t process);
/// Of any user's process, and late by some pages.
[[nodiscard]] std::size_t roughResidentBytesOf(pid_t process);
/// The most that was resident at a time so far.
[[nodiscard]] std::size_t peakResidentBytesOf(pid_t process);
[[nodiscard]] std::size_t threadCountOf(pid_t process);
/// How often threads of the process went to sleep since their start, all living threads together.
[[nodiscard]] std::uint64_t voluntarySwitchesOf(pid_t process);

/// Lets this process have as many open descriptors as it may; answers how many.
std::size_t raiseDescriptorLimit();

} // namespace tamblo::bench
