#include "Processes.h"

#include <cerrno>
#include <filesystem>
#include <fstream>
#include <string>
#include <string_view>
#include <system_error>
#include <vector>

#include <sched.h>
#include <sys/resource.h>
#include <time.h>

namespace tamblo::bench {

namespace {

[[noreturn]] void fail(const std::string& what) {
    throw std::system_error(errno, std::generic_category(), what);
}

/// The processors that this process could run on when it started.
const std::vector<int>& processors() {
    static const std::vector<int> found = [] {
        cpu_set_t set;
        CPU_ZERO(&set);
        if (sched_getaffinity(0, sizeof set, &set) != 0) {
            fail("sched_getaffinity");
        }
        std::vector<int> list;
        for (int i = 0; i < CPU_SETSIZE; ++i) {
            if (CPU_ISSET(static_cast<std::size_t>(i), &set)) {
                list.push_back(i);
            }
        }
        return list;
    }();
    return found;
}

std::chrono::nanoseconds read(clockid_t clock) {
    timespec time{};
    if (clock_gettime(clock, &time) != 0) {
        fail("clock_gettime");
    }
    return std::chrono::seconds(time.tv_sec) + std::chrono::nanoseconds(time.tv_nsec);
}

std::string processFile(pid_t process, std::string_view name) {
    return "/proc/" + std::to_string(process) + "/" + std::string(name);
}

/// The number after "FIELD:" in a file of such lines.
std::uint64_t numberIn(const std::string& file, std::string_view field) {
    std::ifstream lines(file);
    for (std::string line; std::getline(lines, line);) {
        if (line.starts_with(field) && line.size() > field.size() && line[field.size()] == ':') {
            return std::stoull(line.substr(field.size() + 1));
        }
    }
    errno = ENOENT;
    fail(file + " " + std::string(field));
}

} // namespace

int clientProcessor() {
    return processors().front();
}

int serviceProcessor() {
    return processors().size() > 1 ? processors()[1] : processors().front();
}

cpu_set_t processorSet(int processor) {
    cpu_set_t set;
    CPU_ZERO(&set);
    for (const int candidate : processors()) {
        if (processor == kAnyProcessor || processor == candidate) {
            CPU_SET(static_cast<std::size_t>(candidate), &set);
        }
    }
    return set;
}

void pinThisThread(int processor) {
    const cpu_set_t set = processorSet(processor);
    if (sched_setaffinity(0, sizeof set, &set) != 0) {
        fail("sched_setaffinity");
    }
}

std::chrono::nanoseconds cpuTimeOfThisThread() {
    return read(CLOCK_THREAD_CPUTIME_ID);
}

std::chrono::nanoseconds cpuTimeOf(pid_t process) {
    clockid_t clock{};
    if (const int error = clock_getcpuclockid(process, &clock); error != 0) {
        errno = error;
        fail("clock_getcpuclockid");
    }
    return read(clock);
}

std::size_t residentBytesOf(pid_t process) {
    return numberIn(processFile(process, "smaps_rollup"), "Rss") * 1024;
}

std::size_t roughResidentBytesOf(pid_t process) {
    return numberIn(processFile(process, "status"), "VmRSS") * 1024;
}

std::size_t peakResidentBytesOf(pid_t process) {
    return numberIn(processFile(process, "status"), "VmHWM") * 1024;
}

std::size_t threadCountOf(pid_t process) {
    return numberIn(processFile(process, "status"), "Threads");
}

std::uint64_t voluntarySwitchesOf(pid_t process) {
    std::uint64_t sum = 0;
    for (const auto& task : std::filesystem::directory_iterator(processFile(process, "task"))) {
        sum += numberIn(task.path().string() + "/status", "voluntary_ctxt_switches");
    }
    return sum;
}

std::size_t raiseDescriptorLimit() {
    rlimit limit{};
    if (getrlimit(RLIMIT_NOFILE, &limit) != 0) {
        fail("getrlimit");
    }
    limit.rlim_cur = limit.rlim_max;
    if (setrlimit(RLIMIT_NOFILE, &limit) != 0) {
        fail("setrlimit");
    }
    return limit.rlim_cur;
}

} // namespace tamblo::bench
