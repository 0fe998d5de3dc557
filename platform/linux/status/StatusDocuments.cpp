#include "platform/linux/status/StatusDocuments.h"

#include "base/Format.h"
#include "base/JsonObject.h"
#include "base/Mutex.h"
#include "base/SplitText.h"
#include "os/SmallFile.h"
#include "platform/PreferenceDomains.h"
#include "platform/linux/status/MetricsText.h"
#include "platform/linux/status/RowDocuments.h"

#include <algorithm>
#include <array>
#include <cstdlib>
#include <memory>
#include <utility>

#include <sys/stat.h>
#include <unistd.h>

namespace tamblo {

namespace {

constexpr std::chrono::milliseconds kPatienceWithService{1000};

struct Setting {
    std::string name;
    std::string value;
    std::string source;
};

std::string environmentVariable(const char* name) {
    const char* const text = std::getenv(name);
    return text != nullptr ? text : "";
}

Setting directorySetting(const char* name, const std::string& path, const char* variable) {
    return {name, path, environmentVariable(variable).empty() ? "default" : formatted("{}", variable)};
}

std::string octal(mode_t mode) {
    std::string digits;
    for (unsigned shift = 9; shift <= 9; shift -= 3) {
        digits += static_cast<char>('0' + ((mode >> shift) & 7U));
    }
    return digits;
}

/// Bytes of the process in memory.
std::uint64_t residentBytes() {
    const SmallFile file = SmallFile::read("/proc/self/statm", 256);
    std::string_view text = file.text;
    (void)takeUpTo(' ', text);
    return takeNumber<std::uint64_t>(text).value_or(0) * static_cast<std::uint64_t>(::sysconf(_SC_PAGESIZE));
}

/// Each limit is among those that are counted.
std::uint64_t limitHits(std::string_view name) noexcept {
    const auto* const found = std::ranges::find(counters::kLimits, name);
    return counters::valueOf(counters::kFirstLimit +
                             static_cast<std::size_t>(found - counters::kLimits.begin()));
}
std::uint64_t sinkCount(std::string_view fileName, counters::SinkCount what) noexcept {
    const auto* const found = std::ranges::find(counters::kSinks, fileName.substr(0, fileName.rfind('.')));
    return found == counters::kSinks.end()
               ? 0
               : counters::valueOf(counters::kFirstSink +
                                   static_cast<std::size_t>(found - counters::kSinks.begin()) *
                                       counters::kCountsOfSink +
                                   static_cast<std::size_t>(what));
}

void appendCounters(JsonObject& document) {
    document.object("counters", [](JsonObject& all) {
        for (const counters::Family& family : counters::families()) {
            if (family.isHistogram) {
                continue;
            }
            all.array(family.name, family.rows, [](TextBuffer& out, const counters::Row& row) {
                JsonObject(out).text("labels", row.labels).number("value", counters::valueOf(row.slot));
            });
        }
    });
}

void appendErrors(JsonObject& document, const std::vector<LastErrors::Line>& lines) {
    document.array("last_errors", lines, [](TextBuffer& out, const LastErrors::Line& line) {
        JsonObject(out)
            .number("time", secondsSince1970(line.time))
            .text("category", line.category)
            .text("text", line.text);
    });
}

} // namespace

/// A status that waits for what the service adds.
struct StatusDocuments::PendingStatus {
    explicit PendingStatus(Reply whom) : reply(std::move(whom)) {}

    Mutex mutex{};
    Reply reply TAMBLO_GUARDED_BY(mutex);
    std::unique_ptr<DelayedCall> patience TAMBLO_GUARDED_BY(mutex){};
};

void StatusDocuments::answer(const StatusRequest& request, Reply reply) {
    using Kind = StatusRequest::Kind;
    switch (request.kind) {
    case Kind::status:
        return answerStatus(std::move(reply));
    case Kind::clients:
        return source_->clients([reply = std::move(reply)](std::vector<ClientRow> rows) mutable {
            reply([rows = std::move(rows)] { return clientsDocument(rows); });
        });
    case Kind::sessions:
        return source_->sessions([reply = std::move(reply)](std::vector<SessionRow> rows) mutable {
            reply([rows = std::move(rows)] { return sessionsDocument(rows); });
        });
    case Kind::session:
        return source_->session(
            request.reporterID, [reply = std::move(reply)](std::vector<SessionDetail> details) mutable {
                reply([details = std::move(details)] { return sessionDocument(details); });
            });
    case Kind::metrics:
    case Kind::plainMetrics:
        return reply([this, isPlain = request.kind == Kind::plainMetrics] { return metrics(isPlain); });
    }
}

void StatusDocuments::answerStatus(Reply reply) {
    auto pending = std::make_shared<PendingStatus>(std::move(reply));
    const auto finish = [this](PendingStatus& waiting, std::optional<Use> use) {
        MutexLock lock(waiting.mutex);
        Reply whom = std::exchange(waiting.reply, {});
        const auto patience = std::move(waiting.patience);
        lock.unlock();
        if (whom) {
            whom([this, use = std::move(use)] { return status(use); });
        }
    };
    {
        const MutexLock lock(pending->mutex);
        pending->patience = parts_.workQueues.callAfter(
            kPatienceWithService, [pending, finish] { finish(*pending, std::nullopt); });
    }
    parts_.loop.post([this, pending, finish] {
        source_->users([pending, finish, connections = parts_.connections.use()](std::vector<UserRow> users) {
            finish(*pending, Use{connections, std::move(users)});
        });
    });
}

std::string StatusDocuments::metrics(bool isPlain) const {
    const std::string version = formatted("version=\"{}\"", version_);
    std::vector<Gauge> gauges{
        {"build_info", "The version of the service.", 1, version},
        {"start_time_seconds", "When the service was started, in seconds since 1970.",
         secondsSince1970(started_)},
        {"connections", "Clients that are connected.",
         static_cast<double>(parts_.connections.connectionCount())},
        {"sessions", "Sessions that clients have.", static_cast<double>(parts_.activity.sessions.load())},
        {"retained_bytes", "What the messages of all sessions take.",
         static_cast<double>(parts_.activity.retainedBytes.load())},
        {"resident_memory_bytes", "What the process has in memory.", static_cast<double>(residentBytes())},
        {"sinks_out", "Sinks that cannot be written now.", static_cast<double>(parts_.sinks.out().size())},
    };
    TextBuffer out;
    appendMetrics(out, gauges, counterFile_->began(),
                  isPlain ? MetricsForm::plain : MetricsForm::openMetrics);
    return std::string(out.view());
}

std::string StatusDocuments::status(const std::optional<Use>& use) const {
    TextBuffer out;
    {
        JsonObject document(out);
        appendService(document);
        appendSettings(document);
        appendSinks(document);
        appendLimits(document, use);
        appendErrors(document, parts_.log.lastErrors().lines());
        appendCounters(document);
    }
    out.append('\n');
    return std::string(out.view());
}

void StatusDocuments::appendService(JsonObject& document) const {
    const std::chrono::duration<double> uptime = std::chrono::steady_clock::now() - startedSteady_;
    document.text("version", version_)
        .number("pid", ::getpid())
        .number("uid", ::getuid())
        .number("started", secondsSince1970(started_))
        .number("uptime", uptime.count())
        .number("counters_began", static_cast<double>(counterFile_->began()) / 1e9)
        .number("clients", parts_.connections.connectionCount())
        .number("sessions", parts_.activity.sessions.load())
        .number("retained_bytes", parts_.activity.retainedBytes.load())
        .number("resident_bytes", residentBytes());
}

void StatusDocuments::appendSettings(JsonObject& document) const {
    const auto& directories = parts_.directories;
    const std::string filter = environmentVariable("TAMBLO_LOG");
    const std::optional<bool> isInternalBuild = parts_.isInternalBuild();
    std::vector<Setting> settings{
        directorySetting("runtime_directory", directories.runtime, "RUNTIME_DIRECTORY"),
        directorySetting("configuration_directory", directories.configuration, "CONFIGURATION_DIRECTORY"),
        directorySetting("logs_directory", directories.logs, "LOGS_DIRECTORY"),
        {"log", filter.empty() ? "default" : filter, filter.empty() ? "default" : "TAMBLO_LOG"},
        {"internal_build", isInternalBuild.value_or(false) ? "true" : "false",
         isInternalBuild ? directories.deviceProperties() : "default"},
    };
    const auto add = [&](std::string_view domain, std::string_view key, std::string whenAbsent) {
        const auto value = parts_.preferences.copyPreferenceValue(key, domain);
        settings.push_back({std::string(key), value ? jsonText(*value) : std::move(whenAbsent),
                            value ? parts_.preferences.path(domain) : "default"});
    };
    add(kAnalyticsDomain, "events_in_use", R"(["*"])");
    add(kCallQualityDomain, "backends", R"(["spool"])");
    // These are read at the start: what has been changed since is not in force.
    const auto addOfStart = [&](std::string_view domain, std::string_view key, std::string value,
                                const std::string& whenAbsent) {
        const bool isDefault = value == whenAbsent;
        settings.push_back(
            {std::string(key), std::move(value), isDefault ? "default" : parts_.preferences.path(domain)});
    };
    const FileModes modes;
    addOfStart(kSinksDomain, "file_mode", octal(parts_.fileModes.file), octal(modes.file));
    addOfStart(kSinksDomain, "directory_mode", octal(parts_.fileModes.directory), octal(modes.directory));
    const ReportLimits reports;
    addOfStart(kLimitsDomain, "report_files", formatted("{}", reports_.files),
               formatted("{}", reports.files));
    addOfStart(kLimitsDomain, "report_bytes", formatted("{}", reports_.bytes),
               formatted("{}", reports.bytes));
    if (isInternalBuild.value_or(false)) {
        add(kCapturesDomain, "TalvixInvalidXyBackOffSeconds", "no drafts");
        add(kCapturesDomain, "enable_stackburst", "false");
        add(kCapturesDomain, "io_buffer_size", "512");
        add(kCapturesDomain, "io_cycle", "0");
        add(kCapturesDomain, "wait_time", "0");
    }
    document.array("settings", settings, [](TextBuffer& out, const Setting& setting) {
        JsonObject(out)
            .text("name", setting.name)
            .text("value", setting.value)
            .text("source", setting.source);
    });
}

void StatusDocuments::appendSinks(JsonObject& document) const {
    document.array("sinks", parts_.sinks.states(), [](TextBuffer& out, const SinkFiles::State& sink) {
        using counters::SinkCount;
        struct stat status {};
        const bool isThere = ::stat(sink.path.c_str(), &status) == 0;
        JsonObject(out)
            .text("name", sink.name)
            .text("path", sink.path)
            .text("state", sink.isOut ? "out"
                           : isThere  ? "ok"
                                      : "empty")
            .number("size", isThere ? status.st_size : off_t{0})
            .number("lines", sinkCount(sink.name, SinkCount::lines))
            .number("bytes", sinkCount(sink.name, SinkCount::bytes))
            .number("outages", sinkCount(sink.name, SinkCount::outages))
            .number("lost_lines", sinkCount(sink.name, SinkCount::lostOutage) +
                                      sinkCount(sink.name, SinkCount::lostTooLong));
    });
    document.texts("directories_out", parts_.furtherOut());
}

std::optional<std::size_t> StatusDocuments::usedOf(std::string_view limit,
                                                   const std::optional<Use>& use) const {
    if (limit == "retained_bytes") {
        return parts_.activity.retainedBytes.load();
    }
    if (!use) {
        return std::nullopt;
    }
    const auto most = [&use](std::size_t UserRow::*member) {
        std::size_t found = 0;
        for (const UserRow& user : use->users) {
            found = std::max(found, user.*member);
        }
        return found;
    };
    const std::array known = std::to_array<std::pair<std::string_view, std::size_t>>({
        {"connections_of_user", use->connections.connections},
        {"waiting_bytes_of_user", use->connections.waitingBytes},
        {"unfinished_bytes_of_user", use->connections.unfinishedBytes},
        {"reply_bytes_of_user", use->connections.replyBytes},
        {"sessions_of_user", most(&UserRow::sessions)},
        {"configuration_bytes_of_user", most(&UserRow::configurationBytes)},
        {"retained_bytes_of_user", most(&UserRow::retainedBytes)},
    });
    const auto* const found = std::ranges::find(known, limit, [](const auto& row) { return row.first; });
    return found != known.end() ? std::optional(found->second) : std::nullopt;
}

void StatusDocuments::appendLimits(JsonObject& document, const std::optional<Use>& use) const {
    document.value("is_complete", Value(use.has_value()));
    document.array("limits", kLimitRows, [&](TextBuffer& out, const LimitRow& row) {
        const auto preference = Limits::preferenceOf(parts_.preferences, row.name);
        const std::size_t value = parts_.limits.*row.member;
        JsonObject fields(out);
        fields.text("name", row.name).number("value", value);
        if (const auto used = usedOf(row.name, use)) {
            fields.number("used", *used);
        }
        // What has been changed since the start is not in force.
        fields.number("hits", limitHits(row.name))
            .text("source", preference == value ? parts_.preferences.path(kLimitsDomain) : "default");
    });
}

} // namespace tamblo
