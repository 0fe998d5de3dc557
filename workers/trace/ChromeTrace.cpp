#include "workers/trace/ChromeTrace.h"

#include "base/Format.h"
#include "base/JsonObject.h"
#include "base/Utf8.h"
#include "util/Log.h"

#include <chrono>
#include <cmath>
#include <initializer_list>
#include <utility>

namespace tamblo {

namespace {

/// Slices are on tracks of their own, whose numbers are above all that the kernel gives to threads (2^22),
/// and differ between sessions: the files of several may be laid over each other.
enum class Track { session, output, input, count };
constexpr std::int64_t kFirstTrack = (std::int64_t{1} << 22U) + 1;
constexpr std::uint64_t kSessionsApart = 1U << 20U;
/// Bytes of an issue's name: it comes from a client, and nobody reads more of it in a viewer.
constexpr std::size_t kLongestName = 128;

std::int64_t microseconds(WallTime time) noexcept {
    return std::chrono::floor<std::chrono::microseconds>(time.time_since_epoch()).count();
}

/// How much a counter has grown.
double growth(std::uint64_t from, std::uint64_t to) noexcept {
    return to > from ? static_cast<double>(to - from) : 0.0;
}

double growth(std::chrono::microseconds from, std::chrono::microseconds to) noexcept {
    return to > from ? static_cast<double>(to.count()) - static_cast<double>(from.count()) : 0.0;
}

std::string issueName(const SessionTrace::Issue& issue) {
    std::string name;
    if (issue.issueType) {
        name = formatted("{}", *issue.issueType);
    }
    if (name.empty()) {
        name = formatted("{}_{}", ZRReportingUtilityCategoryString(issue.category),
                         ZRReportingUtilityTypeString(issue.type));
    }
    name.resize(cutUtf8(name, kLongestName).size());
    return name;
}

/// Writes one file.
class TraceText {
public:
    explicit TraceText(const SessionTrace& trace) : trace_(trace) {}

    [[nodiscard]] TextBuffer take() {
        text_.append("{\"traceEvents\":[");
        names();
        marks();
        for (const RecordedSamples::Process& process : trace_.recorded.processes) {
            for (std::size_t i = 0; i < process.samples.size(); ++i) {
                counters(process.pid, i != 0 ? &process.samples[i - 1] : nullptr, process.samples[i]);
            }
        }
        text_.append("\n],\"displayTimeUnit\":\"ms\",\"otherData\":");
        appendJson(text_, Dictionary{{"reporterID", trace_.reporterID},
                                     {"serviceName", trace_.serviceName},
                                     {"applicationName", trace_.applicationName},
                                     {"droppedMarks", trace_.droppedMarks}});
        text_.append("}\n");
        return std::move(text_);
    }

private:
    [[nodiscard]] pid_t clientPid() const noexcept {
        return trace_.recorded.processes.empty() ? 0 : trace_.recorded.processes.front().pid;
    }

    /// One event: its numbers behind what all have, then a scope for an instant, then its arguments, if any.
    void event(char phase, std::string_view name, std::int64_t pid, std::int64_t track,
               std::initializer_list<std::pair<std::string_view, std::int64_t>> numbers,
               const Dictionary& arguments = {}) {
        text_.append(std::exchange(isFirst_, false) ? "\n" : ",\n");
        JsonObject event(text_);
        event.text("ph", {&phase, 1}).text("name", name).number("pid", pid).number("tid", track);
        for (const auto& [member, value] : numbers) {
            event.number(member, value);
        }
        if (phase == 'i') {
            event.text("s", "p");
        }
        if (!arguments.empty()) {
            event.value("args", arguments);
        }
    }

    void names() {
        const auto& processes = trace_.recorded.processes;
        for (std::size_t i = 0; i < processes.size() && i < trace_.processNames.size(); ++i) {
            if (!trace_.processNames[i].empty()) {
                event('M', "process_name", processes[i].pid, processes[i].pid, {},
                      {{"name", trace_.processNames[i]}});
            }
        }
        for (const Track track : {Track::session, Track::output, Track::input}) {
            event('M', "thread_name", clientPid(), numberOf(track), {},
                  {{"name", formatted("{} {}", nameOf(track), trace_.reporterID)}});
        }
    }

    [[nodiscard]] std::int64_t numberOf(Track track) const noexcept {
        const auto session =
            static_cast<std::int64_t>(static_cast<std::uint64_t>(trace_.reporterID) % kSessionsApart);
        return kFirstTrack + session * static_cast<std::int64_t>(Track::count) +
               static_cast<std::int64_t>(track);
    }
    static std::string_view nameOf(Track track) noexcept {
        return track == Track::session ? "session" : track == Track::output ? "output" : "input";
    }
    void slice(Track track, WallTime begin, WallTime end, const Dictionary& arguments = {}) {
        event('X', nameOf(track), clientPid(), numberOf(track),
              {{"ts", microseconds(begin)}, {"dur", microseconds(end) - microseconds(begin)}}, arguments);
    }
    void marks() {
        slice(Track::session, trace_.recorded.begin, trace_.recorded.end,
              {{"reporterID", trace_.reporterID}, {"serviceName", trace_.serviceName}});
        for (const SessionTrace::Stretch& stretch : trace_.output) {
            slice(Track::output, stretch.begin, stretch.end);
        }
        for (const SessionTrace::Stretch& stretch : trace_.input) {
            slice(Track::input, stretch.begin, stretch.end);
        }
        for (const SessionTrace::Issue& issue : trace_.issues) {
            event('i', issueName(issue), clientPid(), clientPid(), {{"ts", microseconds(issue.time)}},
                  {{"category", ZRReportingUtilityCategoryString(issue.category)},
                   {"type", ZRReportingUtilityTypeString(issue.type)}});
        }
    }

    void counter(std::string_view name, pid_t pid, const TimedSample& sample, const Dictionary& values) {
        event('C', name, pid, pid, {{"ts", microseconds(sample.time)}}, values);
    }
    /// Totals become rates, for which there has to be a sample before.
    void counters(pid_t pid, const TimedSample* before, const TimedSample& sample) {
        const ProcessSample& now = sample.figures;
        counter("memory (bytes)", pid, sample, {{"resident", now.residentBytes}});
        counter("threads", pid, sample, {{"threads", now.threads}});
        if (before == nullptr || before->time >= sample.time) {
            return;
        }
        const ProcessSample& then = before->figures;
        const double seconds = std::chrono::duration<double>(sample.time - before->time).count();
        // A viewer shows three digits; more would be half of the file.
        const auto rate = [seconds](double gained) { return std::round(gained / seconds * 1e3) / 1e3; };
        const auto percent = [rate](double micros) { return rate(micros / 1e6 * 100); };
        counter("processor time (% of a core)", pid, sample,
                {{"user", percent(growth(then.userTime, now.userTime))},
                 {"system", percent(growth(then.systemTime, now.systemTime))}});
        counter("context switches (per second)", pid, sample,
                {{"voluntary", rate(growth(then.voluntarySwitches, now.voluntarySwitches))},
                 {"involuntary", rate(growth(then.involuntarySwitches, now.involuntarySwitches))}});
        counter("page faults (per second)", pid, sample,
                {{"minor", rate(growth(then.minorFaults, now.minorFaults))},
                 {"major", rate(growth(then.majorFaults, now.majorFaults))}});
    }

    const SessionTrace& trace_;
    TextBuffer text_;
    bool isFirst_ = true;
};

} // namespace

TextBuffer chromeTraceText(const SessionTrace& trace) {
    return TraceText(trace).take();
}

} // namespace tamblo
