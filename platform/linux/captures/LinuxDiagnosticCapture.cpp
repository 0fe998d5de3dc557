#include "platform/linux/captures/LinuxDiagnosticCapture.h"

#include "base/Format.h"
#include "platform/Counters.h"
#include "platform/ProcessList.h"

#include <algorithm>
#include <map>
#include <string_view>
#include <utility>

namespace tamblo {

namespace {

constexpr std::string_view kLogCategory = "zrrl";

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
        if (threads[i].size() > share) {
            counters::add(counters::Counter::threads, threads[i].size() - share);
            threads[i].resize(share);
        }
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

/// The stacks of processes as they stand in the lines of all captures that are about them.
class StacksAsText {
public:
    explicit StacksAsText(const std::vector<ProcessStacks>& processes) {
        for (const ProcessStacks& process : processes) {
            TextBuffer& text = texts_[process.process];
            JsonObject(text)
                .number("process", process.process)
                .text("name", process.name)
                .array("threads", process.threads, appendThread);
        }
    }
    /// In their order; those that were not found are left out.
    [[nodiscard]] std::vector<std::string_view> of(const std::vector<pid_t>& processes) const {
        std::vector<std::string_view> found;
        for (const pid_t process : processes) {
            if (const auto text = texts_.find(process); text != texts_.end()) {
                found.push_back(text->second.view());
            }
        }
        return found;
    }

private:
    std::map<pid_t, TextBuffer> texts_;
};

} // namespace

LinuxDiagnosticCapture::LinuxDiagnosticCapture(SinkFiles& sinks, Clock& clock, WorkQueues& workQueues,
                                               ClientProcesses clientProcesses, StructuredLog& log,
                                               ProcessFiles files)
    : clock_(clock),
      workQueues_(workQueues),
      log_(log),
      clientProcesses_(std::move(clientProcesses)),
      files_(std::move(files)),
      file_(sinks, "stack-captures.jsonl", kLogCategory, AppendOnlyFile::Flushed::byOwner) {}

void LinuxDiagnosticCapture::captureStacks(StackCaptureRequest request) {
    Waiting waiting{std::move(request), clientProcesses_()};
    if (waiting.clients.size() > kMaximumThreads) {
        counters::add(counters::Counter::processes, waiting.clients.size() - kMaximumThreads);
        waiting.clients.resize(kMaximumThreads);
    }
    {
        const MutexLock lock(mutex_);
        if (add(std::move(waiting))) {
            return;
        }
        counters::add(counters::Counter::stackCapturesWaiting);
        if (++dropped_ > 1) {
            return;
        }
    }
    log_.report(LogLevel::error, kLogCategory,
                formatted("{} stack captures, or {} bytes of them, wait; further ones are dropped",
                          kMaximumWaiting, kMaximumWaitingBytes));
}

bool LinuxDiagnosticCapture::add(Waiting&& waiting) {
    const std::size_t bytes = heldBytes(waiting.request.payload);
    if (waiting_.size() == kMaximumWaiting || bytes > kMaximumWaitingBytes - waitingBytes_) {
        return false;
    }
    waitingBytes_ += bytes;
    waiting_.push_back(std::move(waiting));
    if (waiting_.size() == 1) {
        if (queue_ == nullptr) {
            queue_ = workQueues_.makeSerialQueue("com.vandra.tamblo.stackcaptures");
        }
        queue_->post([this] { captureWaiting(); }, Pace::mayBlock);
    }
    return true;
}

std::vector<LinuxDiagnosticCapture::Waiting> LinuxDiagnosticCapture::takeWaiting() {
    std::vector<Waiting> taken;
    std::uint64_t dropped = 0;
    {
        const MutexLock lock(mutex_);
        taken.swap(waiting_);
        waitingBytes_ = 0;
        dropped = std::exchange(dropped_, 0);
    }
    if (dropped != 0) {
        log_.report(LogLevel::error, kLogCategory,
                    formatted("no stack captures wait any more; {} were dropped", dropped));
    }
    return taken;
}

void LinuxDiagnosticCapture::captureWaiting() {
    const std::vector<Waiting> captures = takeWaiting();
    counters::add(counters::Counter::stackCaptures, captures.size());
    ProcessList all(kMaximumThreads);
    std::vector<std::vector<pid_t>> ofEach;
    for (const Waiting& capture : captures) {
        all.addNamedBy(capture.request.payload);
        ProcessList own(kMaximumThreads);
        own.addNamedBy(capture.request.payload);
        own.add(capture.clients);
        counters::add(counters::Counter::processes, own.leftOut());
        ofEach.push_back(std::move(own).take());
    }
    for (const Waiting& capture : captures) {
        all.add(capture.clients);
    }
    std::vector<ProcessStacks> stacks = findThreads(files_, std::move(all).take());
    const WallTime time = clock_.now();
    sampleAll(files_, clock_, stacks);
    const StacksAsText texts(stacks);
    for (std::size_t i = 0; i < captures.size(); ++i) {
        const StackCaptureRequest& request = captures[i].request;
        file_.append([&](TextBuffer& line) {
            SinkLine(line, time)
                .text("requester", request.requester)
                .text("captureType", request.captureType)
                .text("reason", request.reason)
                .value("payload", request.payload)
                .array("options", request.options,
                       [](TextBuffer& element, std::int32_t option) { appendJson(element, Value(option)); })
                .array("stacks", texts.of(ofEach[i]),
                       [](TextBuffer& element, std::string_view text) { element.append(text); });
        });
    }
    file_.flush();
}

} // namespace tamblo
