#include "tools/export/Exporter.h"

#include "base/Format.h"
#include "base/Rfc3339.h"
#include "tools/export/RecordIdentifiers.h"
#include "tools/records/AccessFault.h"
#include "tools/records/Payload.h"

#include <algorithm>
#include <array>
#include <cerrno>
#include <chrono>
#include <cstdio>
#include <ctime>
#include <utility>

#include <sys/inotify.h>
#include <sys/timerfd.h>
#include <unistd.h>

namespace tamblo::tools {

namespace {

constexpr std::int64_t kSecondsPerDay = 86'400;
/// Lines of a piece where the reader does not say.
constexpr std::uint64_t kUsualBatch = 4'096;
/// Commas, colons and opening brackets of a line: what it takes in memory grows with these more than with its
/// bytes.
constexpr std::size_t kMostParts = 32U << 10U;
/// Lines that come one by one are exported together, so that a batch has more than one.
constexpr std::chrono::milliseconds kGathering{200};
constexpr std::size_t kKeptCapacity = 1U << 20U;

constexpr JsonReadOptions kSinkLine{.mostLevels = kMostLevelsOfRecord};

std::string directoryOf(const std::string& path) {
    const std::size_t slash = path.find_last_of('/');
    return slash == 0 ? "/" : path.substr(0, slash);
}

/// Can be read from at a time of the system's clock, and when that is set: unlike a time that is waited for,
/// it comes no later where the device sleeps meanwhile.
FileDescriptor alarmAt(std::int64_t secondsSince1970) {
    FileDescriptor alarm(::timerfd_create(CLOCK_REALTIME, TFD_CLOEXEC | TFD_NONBLOCK));
    const itimerspec when{.it_interval = {}, .it_value = {.tv_sec = secondsSince1970, .tv_nsec = 0}};
    (void)::timerfd_settime(alarm.get(), TFD_TIMER_ABSTIME | TFD_TIMER_CANCEL_ON_SET, &when, nullptr);
    return alarm;
}

bool hasTooManyParts(std::string_view line) {
    return line.size() > kMostParts && static_cast<std::size_t>(std::ranges::count_if(line, [](char byte) {
                                           return byte == ',' || byte == ':' || byte == '[' || byte == '{';
                                       })) > kMostParts;
}

} // namespace

Exporter::Exporter(ExportPlan plan, Cursor cursor, ExportOutput& output)
    : plan_(std::move(plan)),
      cursor_(std::move(cursor)),
      output_(output),
      serviceCount_(plan_.runtimeDirectory) {
    for (const auto& [name, path, isOfService] : plan_.sinks) {
        sinks_.push_back({name, SinkBacklog(path, cursor_.progress(name)), isOfService});
        directories_.insert(directoryOf(path));
    }
}

std::optional<std::string> Exporter::run() {
    for (const std::string& directory : directories_) {
        if (const int fault = faultOfReading(directory)) {
            sayOnce(formatted("cannot read {}: {}", directory, describeFault(fault, directory)));
        }
    }
    bool goesOn = !plan_.follows || watch();
    while (goesOn) {
        goesOn = exportBacklog() && plan_.follows && awaitMore();
    }
    if (problem_.empty()) {
        problem_ = output_.problem();
    }
    // What was not acknowledged has been taken once the output is closed.
    if (problem_.empty() && !output_.close()) {
        problem_ = output_.problem();
    }
    if (problem_.empty()) {
        (void)store();
    }
    if (problem_.empty() && !said_.empty()) {
        problem_ = "not everything could be read";
    }
    return problem_.empty() ? std::nullopt : std::optional(problem_);
}

bool Exporter::exportBacklog() {
    startDay();
    lookAtNews();
    counts_.left = 0;
    const std::uint64_t most = plan_.batch != 0 ? plan_.batch : kUsualBatch;
    std::uint64_t lines = most;
    Piece piece;
    while (Sink* const sink = next(piece, lines)) {
        if (hasNews_) {
            lookAtNews(); // what has just come may be wanted before what is left
            continue;
        }
        if (ExportOutput::isEnding()) {
            return false;
        }
        startDay();
        const Outcome outcome = exportPiece(*sink, piece);
        if (outcome == Outcome::failed) {
            return false;
        }
        if (outcome == Outcome::noBudget && piece.lines == 1) {
            isBudgetSpent_ = true;
            for (const Sink& each : sinks_) {
                counts_.left += each.backlog.leftLines();
            }
            return true;
        }
        // What is left of the day is filled by smaller pieces.
        lines = outcome == Outcome::noBudget ? piece.lines / 2 : most;
        if (outcome == Outcome::taken) {
            ++turn_;
        }
        readEvents();
    }
    return true;
}

void Exporter::lookAtNews() {
    readEvents();
    hasNews_ = false;
    look();
}

/// Where files are gone that nobody has seen to their end, the service may know how many lines they had: what
/// it has written since the last look, but for what is there.
MissedLines Exporter::lookAt(Sink& sink) {
    const auto before = cursor_.written(sink.name);
    const auto now = sink.isOfService ? serviceCount_.of(sink.name) : std::nullopt;
    const bool hadNone = sink.backlog.progress().empty();
    MissedLines missed = sink.backlog.look();
    const auto written = before && now ? now->since(*before) : std::nullopt;
    if ((missed.uncounted || hadNone) && written) {
        missed.known += *written - std::min(*written, sink.backlog.newLines());
        missed.uncounted.reset();
    }
    if (now) {
        cursor_.setWritten(sink.name, *now);
    }
    return missed;
}

void Exporter::look() {
    bool misses = false;
    for (Sink& sink : sinks_) {
        if (const MissedLines missed = lookAt(sink); !missed.isEmpty()) {
            misses = true;
            counts_.missed += missed.known;
            sayMissed(sink, missed);
        }
        for (const std::string& problem : sink.backlog.problems()) {
            sayOnce(problem);
        }
    }
    // Said once, even where the reader then takes nothing.
    if (misses && counts_.records == 0) {
        (void)store();
    }
}

void Exporter::sayOnce(const std::string& text) {
    if (said_.insert(text).second) {
        std::fprintf(stderr, "tambloctl: %s\n", text.c_str());
    }
}

void Exporter::sayMissed(const Sink& sink, const MissedLines& missed) {
    const auto timeText = [](std::int64_t seconds) {
        return seconds == 0 ? std::string("now")
                            : formatRfc3339(static_cast<double>(seconds)).value_or("a time unknown");
    };
    std::string text =
        formatted("{}: {} lines that were not exported are in no file any more", sink.name, missed.known);
    if (missed.uncounted) {
        text += formatted(", and what was written between {} and {}, which nobody counted, may be missing",
                          timeText(missed.uncounted->from), timeText(missed.uncounted->to));
    }
    std::fprintf(stderr, "tambloctl: %s\n", text.c_str());
}

Exporter::Sink* Exporter::next(Piece& piece, std::uint64_t mostLines) {
    for (std::size_t i = 0; i != sinks_.size(); ++i) {
        Sink& sink = sinks_[(turn_ + i) % sinks_.size()];
        piece = sink.backlog.next(plan_.order, mostLines);
        if (piece.lines != 0) {
            turn_ = (turn_ + i) % sinks_.size();
            return &sink;
        }
    }
    return nullptr;
}

Exporter::Outcome Exporter::exportPiece(Sink& sink, const Piece& piece) {
    const Counts counts = format(sink, piece);
    const bool isBatch = plan_.batch != 0 && counts.records != counts_.records;
    if (isBatch) {
        plan_.format->separate(out_);
    }
    if (!fitsBudget(piece)) {
        return Outcome::noBudget;
    }
    if ((isBatch && !output_.hasSilentReader()) || !output_.write(out_.view()) ||
        (isBatch && !output_.awaitAcknowledgement())) {
        problem_ = output_.problem();
        return Outcome::failed;
    }
    counts_ = counts;
    sink.backlog.take(piece);
    Cursor::Spent spent = cursor_.spent();
    spent.bytes += out_.size();
    cursor_.setSpent(spent);
    return plan_.batch == 0 || store() ? Outcome::taken : Outcome::failed;
}

Exporter::Counts Exporter::format(const Sink& sink, const Piece& piece) {
    Counts counts = counts_;
    out_.clearAndKeep(kKeptCapacity);
    if (piece.isTooLong()) {
        ++counts.tooLarge;
        return counts;
    }
    const RecordIdentifiers identifiers(plan_.device.name, sink.name, piece.identity, plan_.secret);
    bool hasBegun = false;
    for (std::size_t at = 0; at != piece.text.size();) {
        const std::size_t end = piece.text.find('\n', at);
        const std::string_view line = std::string_view(piece.text).substr(at, end - at);
        const std::uint64_t offset = piece.range.begin + at;
        at = end + 1;
        if (hasTooManyParts(line)) {
            ++counts.tooLarge;
            continue;
        }
        auto read = parseJsonObject(line, kSinkLine);
        auto* const fields = std::get_if<Dictionary>(&read);
        if (fields == nullptr) {
            ++counts.unreadable;
            continue;
        }
        if (!plan_.filter.accepts(*fields)) {
            continue;
        }
        if (!std::exchange(hasBegun, true)) {
            plan_.format->begin(out_);
        }
        if (!plan_.redaction.isEmpty()) {
            *fields = plan_.redaction.of(*fields);
        }
        plan_.format->add(out_, {identifiers.of(offset, line), sink.name, *fields});
        ++counts.records;
    }
    if (hasBegun) {
        plan_.format->end(out_);
    }
    return counts;
}

void Exporter::startDay() {
    const std::int64_t today = std::time(nullptr) / kSecondsPerDay;
    if (cursor_.spent().day != today) {
        cursor_.setSpent({today, 0});
        isBudgetSpent_ = false;
    }
}

bool Exporter::fitsBudget(const Piece& piece) const {
    const std::uint64_t spent = cursor_.spent().bytes;
    // A record that takes more than a whole day's goes out alone: what stands behind it would never go.
    const bool isFirst = spent == 0 && piece.lines == 1;
    return plan_.bytesPerDay == 0 || out_.empty() || isFirst || spent + out_.size() <= plan_.bytesPerDay;
}

bool Exporter::awaitMore() {
    if (isBudgetSpent_) {
        const std::int64_t left = kSecondsPerDay - std::time(nullptr) % kSecondsPerDay;
        const FileDescriptor nextDay = alarmAt((cursor_.spent().day + 1) * kSecondsPerDay);
        return output_.wait(nextDay.get(), std::chrono::seconds(left));
    }
    return (hasNews_ || output_.wait(watch_.get(), std::nullopt)) && output_.wait(-1, kGathering) && watch();
}

/// Again at each wait, as a directory may have been replaced; the same one is not watched twice.
bool Exporter::watch() {
    if (!watch_.isOpen()) {
        watch_ = FileDescriptor(::inotify_init1(IN_CLOEXEC | IN_NONBLOCK));
    }
    for (const std::string& directory : directories_) {
        constexpr std::uint32_t kEvents =
            IN_MODIFY | IN_CREATE | IN_MOVED_TO | IN_DELETE_SELF | IN_MOVE_SELF | IN_ONLYDIR;
        if (::inotify_add_watch(watch_.get(), directory.c_str(), kEvents) < 0) {
            problem_ = formatted("cannot watch {}: {}", directory, describeFault(errno, directory));
            return false;
        }
    }
    return true;
}

void Exporter::readEvents() {
    std::array<char, 16U << 10U> events;
    while (plan_.follows && ::read(watch_.get(), events.data(), events.size()) > 0) {
        hasNews_ = true;
    }
}

bool Exporter::store() {
    for (const Sink& sink : sinks_) {
        cursor_.set(sink.name, sink.backlog.progress());
    }
    if (auto problem = cursor_.store()) {
        problem_ = *std::move(problem);
    }
    return problem_.empty();
}

} // namespace tamblo::tools
