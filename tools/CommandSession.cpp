#include "base/Format.h"
#include "base/Json.h"
#include "base/NumberText.h"
#include "tools/Command.h"
#include "tools/ServiceConnection.h"
#include "tools/SessionFile.h"
#include "tools/SessionPlayer.h"
#include "tools/SessionSummaries.h"
#include "tools/records/AccessFault.h"
#include "tools/records/Payload.h"
#include "wire/Directories.h"

#include <algorithm>
#include <array>
#include <cerrno>
#include <cmath>
#include <fstream>
#include <iostream>
#include <memory>
#include <sstream>
#include <utility>

#include <sys/stat.h>
#include <unistd.h>

namespace tamblo::tools {

namespace {

constexpr Option kOptions[] = {
    {.name = "--reporter", .value = "ID", .help = "the session's reporter, not 0; needed", .letter = 'r'},
    {.name = "--service-type",
     .value = "TYPE",
     .help = "by name (longformaudio) or number (the file's, else generic)",
     .letter = 't'},
    {.name = "--configuration", .value = "JSON", .help = "an object (the file's)", .letter = 'c'},
    {.name = "--play",
     .value = "FILE",
     .help = "the messages, JSON lines; - is standard input; without it none are sent",
     .letter = 'p'},
    {.name = "--speed",
     .value = "N",
     .help = "play N times as fast as recorded",
     .letter = 's',
     .excludes = "--fast"},
    {.name = "--fast", .value = "", .help = "play as fast as the service takes the messages", .letter = 'f'},
    {.name = "--restamp",
     .value = "",
     .help = "give every message a fresh timestamp, not just those without one"},
    {.name = "--sending-times",
     .value = "",
     .help = "stamp messages with the times at which they are sent, however much faster that is"},
    {.name = "--progress",
     .value = "",
     .help = "show progress though standard error is no terminal",
     .excludes = "--quiet"},
    {.name = "--quiet",
     .value = "",
     .help = "no progress, no report and no summaries",
     .letter = 'q',
     .excludes = "--json"},
    kJsonOption,
    kSocketOption,
    kTimeoutOption,
};

/// What the command line asks for.
struct Plan {
    SessionPlayer::Options player;
    client::ServiceType serviceType{};
    std::optional<Dictionary> configuration;
    std::string file;
};

/// What is given and would be passed over; nothing when all of it counts.
std::optional<std::string> idleOption(const Arguments& arguments) {
    const bool isShow = !arguments.rest().empty() && arguments.rest()[0] == "show";
    constexpr auto kOfShow = std::to_array<std::string_view>({"--json", "--socket"});
    constexpr auto kOfPlay =
        std::to_array<std::string_view>({"--speed", "--fast", "--restamp", "--sending-times", "--progress"});
    for (const Option& option : kOptions) {
        if (isShow && arguments.has(option.name) &&
            std::ranges::find(kOfShow, option.name) == kOfShow.end()) {
            return formatted("session show takes no {}", option.name);
        }
    }
    for (const std::string_view option : kOfPlay) {
        if (arguments.has(option) && !arguments.has("--play")) {
            return formatted("{} needs --play, and a file that is played", option);
        }
    }
    return std::nullopt;
}

std::variant<Plan, std::string> makePlan(const Arguments& arguments) {
    Plan plan;
    if (!arguments.rest().empty()) {
        return formatted("session takes no \"{}\"; a file to play is named with --play", arguments.rest()[0]);
    }
    const auto reporter = parseNumber<std::int64_t>(arguments.last("--reporter").value_or(""));
    if (!reporter || *reporter == 0) {
        return std::string("--reporter needs a signed 64-bit number other than 0");
    }
    plan.player.reporterID = *reporter;
    const auto serviceType = client::parseServiceType(arguments.last("--service-type").value_or("generic"));
    if (!serviceType) {
        return std::string(
            "--service-type needs the name of a service type, such as longformaudio, or its number");
    }
    plan.serviceType = *serviceType;
    if (const auto text = arguments.last("--configuration")) {
        auto configuration = parseJsonObject(*text, kForService);
        if (const auto* wrong = std::get_if<std::string>(&configuration)) {
            return "--configuration is " + *wrong;
        }
        plan.configuration = std::get<Dictionary>(std::move(configuration));
    }
    if (arguments.has("--fast")) {
        plan.player.speed.reset();
    } else if (const auto text = arguments.last("--speed")) {
        const Value speed = parseScalar(*text);
        if (!speed.isNumber() || !(speed.doubleValue() > 0) || !std::isfinite(speed.doubleValue())) {
            return std::string("--speed needs a number above 0");
        }
        plan.player.speed = speed.doubleValue();
    }
    plan.player.restamp = arguments.has("--restamp");
    plan.player.showsProgress =
        !arguments.has("--quiet") && (arguments.has("--progress") || ::isatty(STDERR_FILENO) != 0);
    plan.file = arguments.last("--play").value_or("");
    return plan;
}

/// Reads the file's first line. What a header there says of the session goes where the command line says
/// nothing of it.
std::optional<std::string> takeHeader(std::istream& lines, const Arguments& arguments, Plan& plan) {
    std::string line;
    if (!std::getline(lines, line)) {
        return std::nullopt;
    }
    auto parsed = parseSessionHeader(line);
    plan.player.firstLine = std::move(line);
    if (const auto* wrong = std::get_if<std::string>(&parsed)) {
        return formatted("{}:1: {}", plan.file, *wrong);
    }
    const auto& header = std::get<std::optional<SessionHeader>>(parsed);
    if (header && header->serviceType && !arguments.has("--service-type")) {
        plan.serviceType = *header->serviceType;
    }
    if (header && header->configuration && !plan.configuration) {
        plan.configuration = header->configuration;
    }
    return std::nullopt;
}

/// Makes the session, up to its start, whose reply is held and is noted in `isStartAnswered` when it comes.
std::optional<ExitStatus> begin(ServiceConnection& service, const Plan& plan,
                                const std::shared_ptr<bool>& isStartAnswered) {
    client::Client& client = service.client();
    const std::int64_t reporter = plan.player.reporterID;
    if (const auto failure = service.await(client.createReportingSession(reporter))) {
        return failure;
    }
    if (const auto failure = service.await(client.setServiceType(plan.serviceType, reporter))) {
        return failure;
    }
    if (plan.configuration) {
        if (const auto failure = service.await(client.setConfiguration(*plan.configuration, reporter))) {
            return failure;
        }
    }
    client.startReportingSessionForID(reporter, [isStartAnswered](client::Result<bool>&& result) {
        *isStartAnswered = result.ok() && result.value;
    });
    return std::nullopt;
}

/// What the service derived when the session stopped, or a line that says why there is nothing.
using Summaries = std::variant<std::vector<SessionSummary>, std::string>;

/// How the session's own summary will name it.
StoppedSession describe(const Plan& plan, const SessionPlayer::Report& report) {
    Value application("Unknown");
    for (const std::string_view key : {"QVHostApplicationDisplayID", "HostApplicationDisplayID"}) {
        if (const Value* name = plan.configuration ? plan.configuration->find(key) : nullptr) {
            application = *name;
        }
    }
    return {application, std::string(client::serviceTypeName(plan.serviceType)),
            report.sent - report.refused};
}

void printReport(const Arguments& arguments, const SessionPlayer::Report& report, bool isStartAnswered,
                 const Summaries& found) {
    const auto* summaries = std::get_if<std::vector<SessionSummary>>(&found);
    if (arguments.has("--json")) {
        Dictionary text{{"messages_sent", report.sent},
                        {"messages_refused", report.refused},
                        {"replies", report.answered},
                        {"seconds", report.seconds},
                        {"start_reply", isStartAnswered}};
        Array array;
        if (summaries != nullptr) {
            for (const SessionSummary& summary : *summaries) {
                array.emplace_back(Dictionary{{"event", summary.event}, {"payload", summary.payload}});
            }
        } else {
            text.set("summaries_missing", std::get<std::string>(found));
        }
        text.set("summaries", std::move(array));
        printLine(jsonText(text));
    } else if (!arguments.has("--quiet")) {
        printLine(formatted("{} messages sent, {} refused, {} replies, {} s; the held start reply {}",
                            report.sent, report.refused, report.answered, fixed(report.seconds, 3),
                            isStartAnswered ? "arrived" : "did not arrive"));
        printLine(summaries != nullptr ? summaryTables(*summaries) : std::get<std::string>(found));
    }
}

ExitStatus playAndStop(ServiceConnection& service, const Arguments& arguments, const Plan& plan,
                       std::istream* lines) {
    const auto isStartAnswered = std::make_shared<bool>(false);
    if (const auto failure = begin(service, plan, isStartAnswered)) {
        return *failure;
    }
    SessionPlayer player(service.client(), plan.player);
    std::optional<std::string> wrong;
    if (lines != nullptr) {
        wrong = player.play(*lines, plan.file);
    }
    SummaryReader reader(wire::Directories::ofThisProcess().logs);
    const auto failure = service.await(service.client().stopReportingSessionForID(plan.player.reporterID));
    const Summaries summaries = failure ? Summaries("no summaries: the session was not stopped")
                                        : reader.read(describe(plan, player.report()));
    printReport(arguments, player.report(), *isStartAnswered, summaries);
    if (wrong) {
        return complain(ExitStatus::usage, *wrong);
    }
    if (failure) {
        return *failure;
    }
    if (player.report().firstError) {
        return ServiceConnection::complainAbout(*player.report().firstError);
    }
    return *isStartAnswered && player.report().answered == player.report().sent ? ExitStatus::done
                                                                                : ExitStatus::failed;
}

/// Opens what is to be played, if anything is.
std::optional<ExitStatus> openLines(const std::string& file, std::unique_ptr<std::istream>& lines) {
    if (file == "-") {
        lines = std::make_unique<std::istream>(std::cin.rdbuf());
        return std::nullopt;
    }
    if (file.empty()) {
        return std::nullopt;
    }
    struct stat status {};
    const bool isDirectory = ::stat(file.c_str(), &status) == 0 && S_ISDIR(status.st_mode);
    if (const int fault = isDirectory ? EISDIR : faultOfReading(file)) {
        return complain(ExitStatus::usage, formatted("cannot read {}: {}", file, describeFault(fault, file)));
    }
    lines = std::make_unique<std::ifstream>(file);
    return std::nullopt;
}

/// Has timestamps lie as far apart as recorded, which takes the recording's length; what cannot be read twice
/// is kept.
void keepSpacing(SessionPlayer::Options& player, std::unique_ptr<std::istream>& lines) {
    const bool canBeReadTwice = static_cast<bool>(lines->seekg(0));
    lines->clear();
    if (!canBeReadTwice) {
        auto kept = std::make_unique<std::stringstream>();
        *kept << lines->rdbuf();
        kept->clear();
        lines = std::move(kept);
    }
    player.recordedLength = recordedLength(*lines);
}

ExitStatus run(const Arguments& arguments) {
    if (const auto wrong = idleOption(arguments)) {
        return complain(ExitStatus::usage, *wrong);
    }
    if (!arguments.rest().empty() && arguments.rest()[0] == "show") {
        return showSession(arguments);
    }
    auto made = makePlan(arguments);
    if (const auto* wrong = std::get_if<std::string>(&made)) {
        return complain(ExitStatus::usage, *wrong);
    }
    Plan& plan = std::get<Plan>(made);
    std::unique_ptr<std::istream> lines;
    if (const auto failure = openLines(plan.file, lines)) {
        return *failure;
    }
    const bool playsFaster = !plan.player.speed || *plan.player.speed != 1;
    if (lines != nullptr && playsFaster && !arguments.has("--sending-times")) {
        keepSpacing(plan.player, lines);
    }
    if (const auto wrong =
            lines != nullptr ? takeHeader(*lines, arguments, plan) : std::optional<std::string>()) {
        return complain(ExitStatus::usage, *wrong);
    }
    ServiceConnection service(arguments);
    if (const auto failure = service.connect()) {
        return *failure;
    }
    plan.player.timeout = service.timeout();
    return playAndStop(service, arguments, plan, lines.get());
}

} // namespace

constexpr Command kCommandSession{
    "session",
    "make a session, play recorded messages to it, and stop it",
    "--reporter ID [--service-type TYPE] [--configuration JSON] [--play FILE [--speed N | --fast] "
    "[--restamp] [--sending-times]] | show ID",
    "\"session show ID\" shows a session that there is, with --json as JSON; --socket is the status socket "
    "then.\n"
    "A line of the file: {\"offset_s\": 0.5, \"category\": \"Session_Playback\", \"type\": \"Start\", "
    "\"payload\": {...}}.\n"
    "The first line may be {\"session\": {\"service_type\": \"telephony\", \"configuration\": {...}}}, which "
    "counts where\n"
    "the command line says nothing of it; \"tambloctl record\" writes such files.\n"
    "Messages are sent at their offsets, in seconds since the session's start, or, without those, spaced "
    "like\n"
    "their payloads' zrreporting_timestamp. Played faster, they get timestamps that lie as far apart as "
    "recorded,\n"
    "the last one's being the present: stretches keep their lengths, and the session seems to have begun "
    "earlier.\n"
    "In the end it prints the summaries that the service derived from the session. They are looked up in\n"
    "LOGS_DIRECTORY/analytics-events.jsonl by application, service type and time; if two such sessions stop "
    "at\n"
    "the same moment, they can be mixed up. Exits with 1 when a message was refused or the held reply to "
    "the\n"
    "start did not come, with 2 at a line that cannot be read (the session is stopped first).",
    kOptions,
    run,
};

} // namespace tamblo::tools
