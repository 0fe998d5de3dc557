#include "platform/linux/captures/LinuxDiagnosticCapture.h"

#include "platform/ProcessList.h"

#include <algorithm>
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

/// How many threads of each process are looked at, so that those of all are within the limit: the largest
/// number that does, as it is the process with hundreds that can spare some.
std::size_t shareOf(const std::vector<std::vector<pid_t>>& threads) {
    std::size_t share = LinuxDiagnosticCapture::kMaximumThreads;
    const auto isTooMany = [&] {
        std::size_t total = 0;
        for (const auto& ofProcess : threads) {
            total += std::min(ofProcess.size(), share);
        }
        return total > LinuxDiagnosticCapture::kMaximumThreads;
    };
    while (isTooMany()) {
        --share;
    }
    return share;
}

std::vector<ProcessStacks> findThreads(const ProcessFiles& files, const std::vector<pid_t>& processes) {
    std::vector<ProcessStacks> found;
    std::vector<std::vector<pid_t>> threads;
    for (const pid_t process : processes) {
        if (auto name = files.name(process)) {
            found.push_back({process, std::move(*name), {}});
            threads.push_back(files.threads(process, LinuxDiagnosticCapture::kMaximumThreads));
        }
    }
    const std::size_t share = shareOf(threads);
    for (std::size_t i = 0; i < found.size(); ++i) {
        threads[i].resize(std::min(threads[i].size(), share));
        for (const pid_t thread : threads[i]) {
            if (auto name = files.threadName(found[i].process, thread)) {
                found[i].threads.push_back({thread, std::move(*name), {}});
            }
        }
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
    JsonObject object(line);
    object.number("count", repeated.count).text("state", sample.state);
    if (sample.waitChannel) {
        object.text("waitChannel", *sample.waitChannel);
    }
    if (sample.kernelStack) {
        object.texts("kernelStack", *sample.kernelStack);
    }
}

void appendThread(TextBuffer& line, const ThreadStacks& thread) {
    JsonObject(line)
        .number("thread", thread.thread)
        .text("name", thread.name)
        .array("samples", thread.samples, appendSample);
}

void appendProcess(TextBuffer& line, const ProcessStacks& process) {
    JsonObject(line)
        .number("process", process.process)
        .text("name", process.name)
        .array("threads", process.threads, appendThread);
}

} // namespace

LinuxDiagnosticCapture::LinuxDiagnosticCapture(SinkFiles& sinks, Clock& clock, WorkQueues& workQueues,
                                               ClientProcesses clientProcesses, StructuredLog& log,
                                               ProcessFiles files)
    : clock_(clock),
      clientProcesses_(std::move(clientProcesses)),
      files_(std::move(files)),
      file_(sinks, "stack-captures.jsonl", "zrrl", AppendOnlyFile::Flushed::byOwner),
      queue_(workQueues, "com.vandra.tamblo.stackcaptures",
             {.waiting = kMaximumWaiting, .what = "stack captures", .categoryCode = "zrrl"}, log) {}

void LinuxDiagnosticCapture::captureStacks(StackCaptureRequest request) {
    queue_.post(
        [this, request = std::move(request), clients = clientProcesses_()] { capture(request, clients); });
}

void LinuxDiagnosticCapture::capture(const StackCaptureRequest& request, const std::vector<pid_t>& clients) {
    ProcessList processes(kMaximumThreads);
    processes.addNamedBy(request.payload);
    processes.add(clients);
    std::vector<ProcessStacks> stacks = findThreads(files_, std::move(processes).take());
    const WallTime time = clock_.now();
    sampleAll(files_, clock_, stacks);
    file_.append([&](TextBuffer& line) {
        SinkLine(line, time)
            .text("requester", request.requester)
            .text("captureType", request.captureType)
            .text("reason", request.reason)
            .value("payload", request.payload)
            .array("options", request.options,
                   [](TextBuffer& element, std::int32_t option) { appendJson(element, Value(option)); })
            .array("stacks", stacks, appendProcess);
    });
    file_.flush();
}

} // namespace tamblo
