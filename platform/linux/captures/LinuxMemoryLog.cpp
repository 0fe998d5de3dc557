#include "platform/linux/captures/LinuxMemoryLog.h"

#include <optional>
#include <utility>

namespace tamblo {

namespace {

struct ProcessMemory {
    pid_t process;
    std::string name;
    ProcessFiles::Memory memory;
};

void appendProcess(TextBuffer& line, const ProcessMemory& process) {
    const ProcessFiles::Memory& memory = process.memory;
    JsonObject(line)
        .number("process", process.process)
        .text("name", process.name)
        .number("resident", memory.resident)
        .number("peakResident", memory.peakResident)
        .number("anonymous", memory.anonymous.value_or(0))
        .number("file", memory.file)
        .number("shared", memory.shared)
        .number("swapped", memory.swapped)
        .number("locked", memory.locked)
        .number("pageTables", memory.pageTables)
        .number("threads", memory.threads);
}

void fillKernel(JsonObject& object, const ProcessFiles::KernelMemory& memory) {
    object.number("unevictable", memory.unevictable)
        .number("locked", memory.locked)
        .number("slab", memory.slab)
        .number("slabReclaimable", memory.slabReclaimable)
        .number("slabUnreclaimable", memory.slabUnreclaimable)
        .number("pageTables", memory.pageTables)
        .number("kernelStack", memory.kernelStack);
}

} // namespace

LinuxMemoryLog::LinuxMemoryLog(SinkFiles& sinks, const Clock& clock, WorkQueues& workQueues,
                               StructuredLog& log, ProcessFiles files)
    : clock_(clock),
      files_(std::move(files)),
      file_(sinks, "memory-log.jsonl", "zrrs", AppendOnlyFile::Flushed::byOwner),
      queue_(workQueues, "com.vandra.tamblo.memorylog",
             {.waiting = kMaximumWaiting,
              .ofUser = kMaximumWaitingOfUser,
              .what = "memory records",
              .categoryCode = "zrrs",
              .counted = counters::Counter::memoryRecordsWaiting},
             log) {}

void LinuxMemoryLog::logMemory(std::int64_t reporterID, std::vector<pid_t> processes) {
    queue_.post([this, reporterID, processes = std::move(processes)] { record(reporterID, processes); });
}

void LinuxMemoryLog::record(std::int64_t reporterID, const std::vector<pid_t>& processes) {
    counters::add(counters::Counter::memoryRecords);
    const WallTime time = clock_.now();
    std::vector<ProcessMemory> found;
    for (const pid_t process : processes) {
        auto name = files_.name(process);
        const auto memory = files_.memory(process);
        if (name && memory) {
            found.push_back({process, std::move(*name), *memory});
        }
    }
    const auto kernel = files_.kernelMemory();
    file_.append([&](TextBuffer& line) {
        SinkLine(line, time)
            .number("reporter", reporterID)
            .array("processes", found, appendProcess)
            .object("kernel", [&](JsonObject& object) {
                if (kernel) {
                    fillKernel(object, *kernel);
                }
            });
    });
    file_.flush();
}

} // namespace tamblo
