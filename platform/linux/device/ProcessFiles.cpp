#include "platform/linux/device/ProcessFiles.h"

#include "base/Format.h"
#include "base/SplitText.h"
#include "base/Utf8.h"
#include "os/Directory.h"
#include "os/SmallFile.h"

#include <array>
#include <cerrno>
#include <utility>

#include <unistd.h>

namespace tamblo {

namespace {

/// A name of 15 bytes at most and a line end.
constexpr std::size_t kMaximumName = 64;
/// The name of a function in the kernel.
constexpr std::size_t kMaximumWaitChannel = 1024;
/// `stat` and `status` are some hundred bytes, the latter more on machines with many processors.
constexpr std::size_t kMaximumStatus = 64UL * 1024;
/// A kernel stack is at most 64 calls deep, each with a name of at most 512 bytes.
constexpr std::size_t kMaximumStack = 64UL * 1024;
/// `meminfo` is about two kilobytes.
constexpr std::size_t kMaximumMemoryInformation = 64UL * 1024;

/// The kernel cuts names at 15 bytes, through the middle of a character if need be, and takes any bytes for a
/// name.
std::string asUtf8(std::string name) {
    if (isUtf8(name)) {
        return name;
    }
    std::size_t last = name.size() - 1;
    while (last > 0 && isUtf8Continuation(name[last])) {
        --last;
    }
    if (static_cast<unsigned char>(name[last]) >= 0xC0 && isUtf8(std::string_view(name).substr(0, last))) {
        name.resize(last);
        return name;
    }
    for (char& character : name) {
        if (static_cast<unsigned char>(character) >= 0x80) {
            character = '?';
        }
    }
    return name;
}

std::optional<std::string> readName(const std::string& path) {
    std::string name = SmallFile::read(path, kMaximumName).text;
    if (name.empty()) {
        return std::nullopt;
    }
    if (name.back() == '\n') {
        name.pop_back();
    }
    return asUtf8(std::move(name));
}

std::optional<std::uint64_t> numberOfField(std::string_view text, std::string_view name) {
    auto field = fieldOf(text, name);
    return field ? takeNumber<std::uint64_t>(*field) : std::nullopt;
}

/// The bytes of a line such as "RssAnon:      1234 kB".
std::optional<std::uint64_t> bytesOfField(std::string_view text, std::string_view name) {
    const auto kibibytes = numberOfField(text, name);
    return kibibytes ? std::optional(*kibibytes * 1024) : std::nullopt;
}

/// From a process's `status`, or an `errno`.
std::variant<ProcessFiles::Memory, int> readMemory(const std::string& path) {
    const SmallFile status = SmallFile::read(path, kMaximumStatus);
    if (status.error != 0) {
        return status.error;
    }
    const auto resident = bytesOfField(status.text, "VmRSS");
    if (!resident) {
        return ENODATA;
    }
    const auto bytes = [&](std::string_view field) { return bytesOfField(status.text, field).value_or(0); };
    return ProcessFiles::Memory{.resident = *resident,
                                .peakResident = bytes("VmHWM"),
                                .anonymous = bytesOfField(status.text, "RssAnon"),
                                .file = bytes("RssFile"),
                                .shared = bytes("RssShmem"),
                                .swapped = bytes("VmSwap"),
                                .locked = bytes("VmLck"),
                                .pageTables = bytes("VmPTE"),
                                .threads = numberOfField(status.text, "Threads").value_or(0)};
}

std::optional<std::vector<std::string>> readStack(const std::string& path) {
    const SmallFile file = SmallFile::read(path, kMaximumStack);
    if (file.error != 0) {
        return std::nullopt;
    }
    std::vector<std::string> calls;
    for (std::string_view rest = file.text; !rest.empty();) {
        // "[<0>] futex_wait+0x66/0x120": the address is kept from everybody.
        std::string_view call = takeUpTo('\n', rest);
        if (const std::size_t end = call.find(">] "); call.starts_with("[<") && end != call.npos) {
            call.remove_prefix(end + 3);
        }
        calls.push_back(asUtf8(std::string(call)));
    }
    return calls;
}

/// The fields of `stat` from the state, which is number 3, on. What stands in front of them is the name, in
/// parentheses, and may itself hold parentheses, spaces and line ends.
class StatFields {
public:
    explicit StatFields(std::string_view stat) {
        const std::size_t name = stat.rfind(") ");
        std::string_view rest = name == stat.npos ? std::string_view() : stat.substr(name + 2);
        for (std::string_view& field : fields_) {
            field = takeUpTo(' ', rest);
        }
    }
    [[nodiscard]] bool isComplete() const noexcept { return !fields_.back().empty(); }
    /// By its number in the kernel's documents; 0 for what is no number.
    [[nodiscard]] std::uint64_t number(std::size_t field) const {
        std::string_view text = fields_[field - 3];
        return takeNumber<std::uint64_t>(text).value_or(0);
    }
    [[nodiscard]] std::chrono::microseconds time(std::size_t field) const {
        static const auto ticksPerSecond = static_cast<std::uint64_t>(::sysconf(_SC_CLK_TCK));
        return std::chrono::microseconds(number(field) * (std::micro::den / ticksPerSecond));
    }

    static constexpr std::size_t kMinorFaults = 10;
    static constexpr std::size_t kMajorFaults = 12;
    static constexpr std::size_t kUserTime = 14;
    static constexpr std::size_t kSystemTime = 15;
    static constexpr std::size_t kThreads = 20;
    static constexpr std::size_t kResidentPages = 24;

private:
    std::array<std::string_view, kResidentPages - 2> fields_;
};

} // namespace

std::string ProcessFiles::pathOf(pid_t pid, std::string_view file) const {
    return formatted("{}/{}/{}", root_, pid, file);
}

std::string ProcessFiles::pathOf(pid_t pid, pid_t thread, std::string_view file) const {
    return formatted("{}/{}/task/{}/{}", root_, pid, thread, file);
}

std::optional<std::string> ProcessFiles::name(pid_t pid) const {
    return pid > 0 ? readName(pathOf(pid, "comm")) : std::nullopt;
}

std::vector<pid_t> ProcessFiles::threads(pid_t pid, std::size_t limit) const {
    std::vector<pid_t> threads;
    for (std::string_view name : DirectoryEntries::read(pathOf(pid, "task"), kMaximumThreads).names) {
        const auto thread = takeNumber<pid_t>(name);
        if (thread.value_or(0) > 0 && threads.size() < limit) {
            threads.push_back(*thread);
        }
    }
    return threads;
}

std::optional<std::string> ProcessFiles::threadName(pid_t pid, pid_t thread) const {
    return readName(pathOf(pid, thread, "comm"));
}

std::optional<ProcessFiles::ThreadSample> ProcessFiles::sampleThread(pid_t pid, pid_t thread) const {
    const SmallFile status = SmallFile::read(pathOf(pid, thread, "status"), kMaximumStatus);
    const auto state = fieldOf(status.text, "State");
    if (!state) {
        return std::nullopt;
    }
    ThreadSample sample;
    sample.state = asUtf8(std::string(*state));
    // "0" is a thread that does not wait, and one that may not be looked at.
    std::string channel = SmallFile::read(pathOf(pid, thread, "wchan"), kMaximumWaitChannel).text;
    if (!channel.empty() && channel != "0") {
        sample.waitChannel = asUtf8(std::move(channel));
    }
    sample.kernelStack = readStack(pathOf(pid, thread, "stack"));
    return sample;
}

std::optional<ProcessSample> ProcessFiles::sample(pid_t pid) const {
    static const auto bytesPerPage = static_cast<std::uint64_t>(::sysconf(_SC_PAGESIZE));
    const SmallFile stat = SmallFile::read(pathOf(pid, "stat"), kMaximumStatus);
    const StatFields fields(stat.text);
    if (!fields.isComplete()) {
        return std::nullopt;
    }
    ProcessSample sample;
    sample.userTime = fields.time(StatFields::kUserTime);
    sample.systemTime = fields.time(StatFields::kSystemTime);
    sample.minorFaults = fields.number(StatFields::kMinorFaults);
    sample.majorFaults = fields.number(StatFields::kMajorFaults);
    sample.residentBytes = fields.number(StatFields::kResidentPages) * bytesPerPage;
    sample.threads = fields.number(StatFields::kThreads);
    addSwitches(pid, sample);
    return sample;
}

void ProcessFiles::addSwitches(pid_t pid, ProcessSample& sample) const {
    for (const pid_t thread : threads(pid)) {
        const SmallFile status = SmallFile::read(pathOf(pid, thread, "status"), kMaximumStatus);
        sample.voluntarySwitches += numberOfField(status.text, "voluntary_ctxt_switches").value_or(0);
        sample.involuntarySwitches += numberOfField(status.text, "nonvoluntary_ctxt_switches").value_or(0);
    }
}

std::optional<ProcessFiles::Memory> ProcessFiles::memory(pid_t pid) const {
    const auto memory = readMemory(pathOf(pid, "status"));
    const auto* known = std::get_if<Memory>(&memory);
    return known != nullptr ? std::optional(*known) : std::nullopt;
}

std::variant<ProcessFiles::Memory, int> ProcessFiles::ownMemory() const {
    return readMemory(root_ + "/self/status");
}

std::optional<ProcessFiles::KernelMemory> ProcessFiles::kernelMemory() const {
    const SmallFile information = SmallFile::read(root_ + "/meminfo", kMaximumMemoryInformation);
    if (information.error != 0) {
        return std::nullopt;
    }
    const auto bytes = [&](std::string_view field) {
        return bytesOfField(information.text, field).value_or(0);
    };
    return KernelMemory{.unevictable = bytes("Unevictable"),
                        .locked = bytes("Mlocked"),
                        .slab = bytes("Slab"),
                        .slabReclaimable = bytes("SReclaimable"),
                        .slabUnreclaimable = bytes("SUnreclaim"),
                        .pageTables = bytes("PageTables"),
                        .kernelStack = bytes("KernelStack")};
}

} // namespace tamblo
