#include "base/Format.h"
#include "base/Json.h"
#include "base/NamePattern.h"
#include "base/NumberText.h"
#include "os/PreferenceFile.h"
#include "platform/PreferenceDomains.h"
#include "tools/Command.h"
#include "tools/ServiceConnection.h"
#include "tools/SessionPlayer.h"
#include "tools/TimeText.h"
#include "tools/records/AccessFault.h"
#include "tools/records/Payload.h"
#include "tools/records/SinkFile.h"
#include "wire/Directories.h"
#include "wire/EventNames.h"

#include <algorithm>
#include <cerrno>
#include <cmath>
#include <span>
#include <string>
#include <variant>
#include <vector>

namespace tamblo::tools {

namespace {

constexpr Option kOptions[] = {
    {.name = "--category",
     .value = "CATEGORY",
     .help = "by name (Volume, Session_Playback) or number; needed; \"tambloctl list categories\"",
     .letter = 'c'},
    {.name = "--type",
     .value = "TYPE",
     .help = "by name (Start, Summary) or number (Generic); \"tambloctl list types\"",
     .letter = 't'},
    {.name = "--reporter",
     .value = "ID",
     .help = "the session's reporter; may be given several times",
     .letter = 'r',
     .isRepeatable = true},
    kJsonOption,
    kSocketOption,
    kTimeoutOption,
};

struct Plan {
    client::EventCategory category{};
    client::EventType type{};
    std::vector<std::int64_t> reporters;
    Dictionary payload;
};

std::variant<Plan, std::string> makePlan(const Arguments& arguments) {
    Plan plan;
    const auto category = client::parseCategory(arguments.last("--category").value_or(""));
    if (!category) {
        return std::string(
            "--category needs the name of a category, such as Volume or Session_Playback, or its "
            "number; \"tambloctl list categories\" has them");
    }
    plan.category = *category;
    const auto type = client::parseType(arguments.last("--type").value_or("Generic"));
    if (!type) {
        return std::string("--type needs the name of a type, such as Start, or its number; \"tambloctl list "
                           "types\" has them");
    }
    plan.type = *type;
    for (const std::string_view text : arguments.all("--reporter")) {
        const auto reporter = parseNumber<std::int64_t>(text);
        if (!reporter) {
            return notAReporterID(text);
        }
        plan.reporters.push_back(*reporter);
    }
    auto payload = parsePayload(arguments.rest());
    if (auto* wrong = std::get_if<std::string>(&payload)) {
        return std::move(*wrong);
    }
    plan.payload = std::get<Dictionary>(std::move(payload));
    return plan;
}

/// What became of a message, as far as it can be known.
enum class Outcome : std::uint8_t {
    recorded,
    unrecorded, ///< the service answered, and no line came
    noReporter, ///< nobody has the reporter's ID
    notInUse,   ///< no line would tell: the preference leaves its events out
    unseen,     ///< the sink cannot be read
};

std::string_view nameOf(Outcome outcome) noexcept {
    switch (outcome) {
    case Outcome::recorded:
        return "recorded";
    case Outcome::unrecorded:
        return "unrecorded";
    case Outcome::noReporter:
        return "noReporter";
    case Outcome::notInUse:
        return "notInUse";
    case Outcome::unseen:
        break;
    }
    return "unseen";
}

/// Looks for a message's lines in the analytics sink. The reply to a message says nothing of what became of
/// it, but its lines are in the file when the reply comes. Made before the message is sent.
class EventWatch {
public:
    EventWatch() : EventWatch(sinkPath(wire::Directories::ofThisProcess().logs, "analytics-events")) {}

    [[nodiscard]] const std::string& path() const noexcept { return path_; }
    /// Why the sink cannot be read; 0 where it can, or is not there yet.
    [[nodiscard]] int fault() const noexcept { return fault_; }

    /// The names of the events that the message with this timestamp has become since the last call, one for
    /// each line. The service replaces a timestamp that is too old, and keeps it under another key.
    [[nodiscard]] std::vector<std::string> readEvents(const Value& timestamp) {
        std::vector<std::string> events;
        LineFunction take = [&](std::string_view line) {
            const auto read = parseJsonObject(line);
            const auto* record = std::get_if<Dictionary>(&read);
            const Value* const payload = record == nullptr ? nullptr : record->find("payload");
            if (payload != nullptr &&
                (has(*payload, kTimestampKey, timestamp) || has(*payload, "invalid_timestamp", timestamp))) {
                events.push_back(nameOfRecord(*record));
            }
        };
        sink_.readNew(take);
        return events;
    }

private:
    explicit EventWatch(std::string path)
        : path_(std::move(path)), fault_(faultOfReading(path_)), sink_(path_) {
        fault_ = fault_ == ENOENT ? 0 : fault_;
        sink_.skipToEnd();
    }
    static bool has(const Value& payload, std::string_view key, const Value& value) {
        const Value* const found = payload.dictionaryValue().find(key);
        return found != nullptr && *found == value;
    }

    const std::string path_;
    int fault_;
    SinkFollower sink_;
};

/// Whether one of the names is that of an event in use, as far as the preference can be read.
bool isAnyInUse(std::span<const std::string> names) {
    const auto file = PreferenceFile::of(wire::Directories::ofThisProcess().preferences(), kAnalyticsDomain);
    const auto content = file ? file->read() : std::variant<Dictionary, std::string>();
    const auto* const values = std::get_if<Dictionary>(&content);
    const Value* const inUse = values == nullptr ? nullptr : values->find("events_in_use");
    if (inUse == nullptr || !inUse->isArray()) {
        return true;
    }
    const std::span<const Value> patterns = inUse->arrayValue();
    return std::any_of(names.begin(), names.end(), [&patterns](const std::string& name) {
        return std::any_of(patterns.begin(), patterns.end(), [&name](const Value& pattern) {
            return matchesPattern(name, pattern.stringValue());
        });
    });
}

/// What became of the message for one reporter, or for all started sessions.
struct Report {
    std::optional<std::int64_t> reporter;                              ///< none: the message was for all
    client::ServiceType serviceType = client::ServiceType::standalone; ///< the reporter's
    Outcome outcome = Outcome::unseen;
    std::size_t sessions = 0; ///< that recorded it
    std::vector<std::string> events{};
};

class Sender {
public:
    Sender(ServiceConnection& service, const Plan& plan) : service_(service), plan_(plan) {}

    /// Sends to one reporter, or to all started sessions.
    std::optional<ExitStatus> send(std::optional<std::int64_t> reporter) {
        Report report{.reporter = reporter};
        if (reporter) {
            Dictionary answer;
            if (const auto failure = service_.await(service_.client().reporterID(*reporter), &answer)) {
                return failure;
            }
            const Value* const found = answer.find("reporterID");
            if (*reporter == 0 || found == nullptr || !(*found == Value(*reporter))) {
                report.outcome = Outcome::noReporter;
                reports_.push_back(std::move(report));
                return std::nullopt;
            }
            const Value* const type = answer.find("serviceType");
            report.serviceType =
                static_cast<client::ServiceType>(type == nullptr ? 0 : type->unsignedValue());
        }
        Dictionary payload = plan_.payload;
        if (!payload.contains(kTimestampKey)) {
            payload.set(kTimestampKey, nextTimestamp());
        }
        std::vector<std::int64_t> reporters;
        if (reporter) {
            reporters.push_back(*reporter);
        }
        if (const auto failure = service_.await(
                service_.client().sendMessage(payload, plan_.category, plan_.type, reporters))) {
            return failure;
        }
        note(report, *payload.find(kTimestampKey));
        reports_.push_back(std::move(report));
        return std::nullopt;
    }

    [[nodiscard]] const std::vector<Report>& reports() const noexcept { return reports_; }
    [[nodiscard]] std::string textOf(const Report& report) const;

private:
    /// The names of the events that the message becomes in a session of the service type.
    [[nodiscard]] std::vector<std::string> eventNames(client::ServiceType service) const {
        const auto category = static_cast<std::uint32_t>(plan_.category);
        const auto type = static_cast<std::uint16_t>(plan_.type);
        return {wire::eventName(wire::kAllServices, category, type),
                wire::eventName(client::serviceTypeName(service), category, type)};
    }
    /// Differs from message to message, so that their lines can be told apart.
    double nextTimestamp() {
        return lastTimestamp_ = std::max(presentTime(), std::nextafter(lastTimestamp_, HUGE_VAL));
    }
    void note(Report& report, const Value& timestamp) {
        if (watch_.fault() != 0) {
            return;
        }
        std::vector<std::string> events = watch_.readEvents(timestamp);
        const auto general = static_cast<std::size_t>(
            std::count_if(events.begin(), events.end(),
                          [](const std::string& event) { return event.starts_with("com.vandra.tamblo."); }));
        if (!events.empty()) {
            report.outcome = Outcome::recorded;
        } else {
            report.outcome =
                isAnyInUse(eventNames(report.serviceType)) ? Outcome::unrecorded : Outcome::notInUse;
        }
        // A session adds a line under the name that all service types share and one under its own, of which
        // those that are in use are written.
        report.sessions = general != 0 ? general : events.size();
        std::sort(events.begin(), events.end());
        events.erase(std::unique(events.begin(), events.end()), events.end());
        report.events = std::move(events);
    }

    ServiceConnection& service_;
    const Plan& plan_;
    EventWatch watch_;
    double lastTimestamp_ = 0;
    std::vector<Report> reports_;
};

std::string Sender::textOf(const Report& report) const {
    const std::string who = report.reporter ? formatted("reporter {}: ", *report.reporter) : std::string();
    switch (report.outcome) {
    case Outcome::noReporter:
        return who + "no client has it; nothing was recorded";
    case Outcome::notInUse:
        return formatted(
            "{}sent; whether it was recorded cannot be seen: its events are not in use (preference "
            "events_in_use of com.vandra.tamblo.analytics)",
            who);
    case Outcome::unseen:
        return formatted("{}sent; whether it was recorded cannot be seen: cannot read {}: {}", who,
                         watch_.path(), describeFault(watch_.fault(), watch_.path()));
    case Outcome::unrecorded:
        return formatted(
            "{}not recorded, as no line of it came to {}: it repeats the last message of its category "
            "and type, or else the sink is out or another service's",
            who, watch_.path());
    case Outcome::recorded:
        break;
    }
    std::string events;
    for (const std::string& event : report.events) {
        events.append(events.empty() ? "" : ", ").append(event);
    }
    const std::string sessions =
        report.reporter ? std::string()
                        : formatted(" in {} session{}", report.sessions, report.sessions == 1 ? "" : "s");
    return formatted("{}recorded{} as {}", who, sessions, events);
}

void printReports(const Arguments& arguments, const Sender& sender) {
    Array results;
    bool isSent = false;
    for (const Report& report : sender.reports()) {
        isSent = isSent || report.outcome != Outcome::noReporter;
        if (!arguments.has("--json")) {
            printLine(sender.textOf(report));
            continue;
        }
        Array events(report.events.begin(), report.events.end());
        Dictionary result{{"outcome", nameOf(report.outcome)},
                          {"sessions", report.sessions},
                          {"events", std::move(events)}};
        if (report.reporter) {
            result.set("reporterID", *report.reporter);
        }
        results.emplace_back(std::move(result));
    }
    if (arguments.has("--json")) {
        printLine(jsonText(Dictionary{{"sent", isSent}, {"results", std::move(results)}}));
    }
}

ExitStatus run(const Arguments& arguments) {
    const auto made = makePlan(arguments);
    if (const auto* wrong = std::get_if<std::string>(&made)) {
        return complain(ExitStatus::usage, *wrong);
    }
    const Plan& plan = std::get<Plan>(made);
    ServiceConnection service(arguments);
    if (const auto failure = service.connect()) {
        return *failure;
    }
    Sender sender(service, plan);
    std::optional<ExitStatus> failure;
    if (plan.reporters.empty()) {
        failure = sender.send(std::nullopt);
    }
    for (auto reporter = plan.reporters.begin(); !failure && reporter != plan.reporters.end(); ++reporter) {
        failure = sender.send(*reporter);
    }
    printReports(arguments, sender);
    if (failure) {
        return *failure;
    }
    const bool isLost =
        std::any_of(sender.reports().begin(), sender.reports().end(), [](const Report& report) {
            return report.outcome == Outcome::noReporter || report.outcome == Outcome::unrecorded;
        });
    return isLost ? ExitStatus::failed : ExitStatus::done;
}

} // namespace

constexpr Command kCommandSend{
    "send",
    "send one message, and say what became of it",
    "--category CATEGORY [--type TYPE] [--reporter ID]... [KEY=VALUE... | JSON]",
    "A value that is a JSON number, true or false is taken as one; any other is a text. A message reaches a\n"
    "reporter whichever client made it. Without a reporter it goes to every started session of every client "
    "or,\n"
    "when none is started, to the service's single-message session.\n"
    "What became of it is looked up in LOGS_DIRECTORY/analytics-events.jsonl, as the service's reply does "
    "not\n"
    "tell. Exits with 1 when a reporter does not exist or nothing was recorded.",
    kOptions,
    run,
};

} // namespace tamblo::tools
