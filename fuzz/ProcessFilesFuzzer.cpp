// Any bytes as what the kernel tells of a process, a thread and itself: figures and texts that sinks take, or
// nothing.

#include "Demand.h"
#include "base/Utf8.h"
#include "platform/linux/device/ProcessFiles.h"

#include <cstdint>

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* bytes, std::size_t size) {
    using namespace tamblo;
    using fuzz::demand;
    constexpr pid_t kProcess = 5, kThread = 7;
    static const fuzz::ScratchDirectory directory;
    const std::string_view content(reinterpret_cast<const char*>(bytes), size);
    for (const char* const name :
         {"5/comm", "5/stat", "5/status", "5/smaps_rollup", "5/task/7/comm", "5/task/7/stat",
          "5/task/7/status", "5/task/7/wchan", "5/task/7/stack", "self/stat", "self/status", "meminfo"}) {
        directory.write(name, content);
    }

    const ProcessFiles files(directory.path());
    for (const auto& name : {files.name(kProcess), files.threadName(kProcess, kThread)}) {
        demand(!name || isUtf8(*name));
    }
    demand(files.threads(kProcess) == std::vector<pid_t>{kThread});
    if (const auto sample = files.sampleThread(kProcess, kThread)) {
        demand(isUtf8(sample->state) && (!sample->waitChannel || isUtf8(*sample->waitChannel)));
        for (const std::string& call : sample->kernelStack.value_or(std::vector<std::string>())) {
            demand(isUtf8(call));
        }
    }
    (void)files.sample(kProcess);
    (void)files.memory(kProcess);
    (void)files.ownMemory();
    (void)files.kernelMemory();
    return 0;
}
