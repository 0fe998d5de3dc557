#include "platform/linux/LinuxDiagnosticCapture.h"

#include "platform/ProcessList.h"
#include "platform/linux/SinkLine.h"

#include <utility>

namespace tamblo {

namespace {

struct RepeatedSample {
    ProcessFiles::ThreadSample sample;
    int count;
};

struct ThreadStacks {
    pid_t thread;
    std::string name;
    std::vector<RepeatedSample> samples;
};

struct ProcessStacks {
    pid_t process;
    std::string name;
    std::vector<ThreadStacks> threads;
};

std::vector<ProcessStacks> findThreads(const ProcessFiles& files, const std::vector<pid_t>& processes) {
    std::vector<ProcessStacks> found;
    std::size_t left = LinuxDiagnosticCapture::kMaximumThreads;
    for (const pid_t process : processes) {
        auto name = files.name(process);
        if (!name) {
            continue;
        }
        ProcessStacks& stacks = found.emplace_back(ProcessStacks{process, std::move(*name), {}});
        for (const pid_t thread : files.threads(process, left)) {
            if (auto threadName = files.threadName(process, thread)) {
                stacks.threads.push_back({thread, std::move(*threadName), {}});
            }
        }
        left -= stacks.threads.size();
    }
    return found;
}

void sample(const ProcessFiles& files, pid_t process, ThreadStacks& thread) {
    auto sample = files.sampleThread(process, thread.thread);
    if (!sample) {
        return;
    }
    if (!thread.samples.empty() && thread.samples.back().sample == *sample) {
        ++thread.samples.back().count;
    } else {
        thread.samples.push_back({std::move(*sample), 1});
    }
}

void sampleAll(const ProcessFiles& files, Clock& clock, std::vector<ProcessStacks>& processes) {
    for (int i = 0; i < LinuxDiagnosticCapture::kSamples; ++i) {
        if (i > 0) {
            clock.sleepFor(LinuxDiagnosticCapture::kSampleInterval);
        }
        for (ProcessStacks& process : processes) {
            for (ThreadStacks& thread : process.threads) {
                sample(files, process.process, thread);
            }
        }
    }
}

void appendSample(TextBuffer& line, const RepeatedSample& repeated) {
    const ProcessFiles::ThreadSample& sample = repeated.sample;
    SinkObject object(line);
    object.number("count", repeated.count).text("state", sample.state);
    if (sample.waitChannel) {
        object.text("waitChannel", *sample.waitChannel);
    }
    if (sample.kernelStack) {
        object.texts("kernelStack", *sample.kernelStack);
    }
}

void appendThread(TextBuffer& line, const ThreadStacks& thread) {
    SinkObject(line)
        .number("thread", thread.thread)
        .text("name", thread.name)
        .array("samples", thread.samples, appendSample);
}

void appendProcess(TextBuffer& line, const ProcessStacks& process) {
    SinkObject(line)
        .number("process", process.process)
        .text("name", process.name)
        .array("threads", process.threads, appendThread);
}

} // namespace

LinuxDiagnosticCapture::LinuxDiagnosticCapture(const std::string& logsDirectory, Clock& clock,
                                               WorkQueues& workQueues, ClientProcesses clientProcesses,
                                               StructuredLog& log, ProcessFiles files,
                                               FileOperations& operations)
    : clock_(clock),
      clientProcesses_(std::move(clientProcesses)),
      files_(std::move(files)),
      file_(logsDirectory + "/stack-captures.jsonl", "zrrp", log, operations),
      queue_(workQueues, "com.vandra.tamblo.stackcaptures",
             {.waiting = kMaximumWaiting, .what = "stack captures", .categoryCode = "zrrp"}, log) {}

void LinuxDiagnosticCapture::captureStacks(StackCaptureRequest request) {
    ProcessList processes;
    processes.addNamedBy(request.payload);
    processes.add(clientProcesses_());
    queue_.post([this, request = std::move(request), named = std::move(processes).take()] {
        capture(request, named);
    });
}

void LinuxDiagnosticCapture::capture(const StackCaptureRequest& request,
                                     const std::vector<pid_t>& processes) {
    const WallTime time = clock_.now();
    std::vector<ProcessStacks> stacks = findThreads(files_, processes);
    sampleAll(files_, clock_, stacks);
    file_.append([&](TextBuffer& line) {
        SinkLine(line, time)
            .text("requester", request.requester)
            .text("captureType", request.captureType)
            .text("reason", request.reason)
            .dictionary("payload", request.payload)
            .array("options", request.options,
                   [](TextBuffer& element, std::int32_t option) { appendJson(element, Value(option)); })
            .array("stacks", stacks, appendProcess);
    });
    file_.flush();
}

} // namespace tamblo
