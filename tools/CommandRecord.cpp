#include "base/Format.h"
#include "base/Json.h"
#include "base/NumberText.h"
#include "tools/Command.h"
#include "tools/LiveRecorder.h"
#include "tools/ServiceConnection.h"
#include "tools/SessionFile.h"
#include "tools/SessionRecorder.h"
#include "tools/StatusConnection.h"
#include "tools/TapLines.h"
#include "tools/records/Payload.h"
#include "tools/records/SinkFile.h"
#include "tools/records/SinkSnapshot.h"
#include "wire/Directories.h"

#include <algorithm>
#include <array>
#include <cerrno>
#include <csignal>
#include <cstdio>
#include <cstring>
#include <memory>
#include <span>

#include <sys/socket.h>

namespace tamblo::tools {

namespace {

constexpr Option kOptions[] = {
    {.name = "--session", .value = "NAME", .help = "the session of this name in the call-quality file"},
    {.name = "--reporter", .value = "ID", .help = "the last session of this reporter", .letter = 'r'},
    {.name = "--app", .value = "NAME", .help = "the last session of this application"},
    {.name = "--output",
     .value = "FILE",
     .help = "the file that is written; - and none: standard output",
     .letter = 'o'},
    {.name = "--live",
     .value = "",
     .help = "the reporter's session as it goes on, or the next one, until it stops"},
    kStatusSocketOption,
};

struct CloseFile {
    void operator()(std::FILE* file) const noexcept {
        if (file != stdout) {
            static_cast<void>(std::fclose(file));
        }
    }
};
using OutputFile = std::unique_ptr<std::FILE, CloseFile>;

std::string outputName(const Arguments& arguments) {
    return std::string(arguments.last("--output").value_or("-"));
}

ExitStatus complainAboutOutput(const std::string& name) {
    return complain(ExitStatus::failed, formatted("cannot write {}: {}", name, std::strerror(errno)));
}

/// Null, behind a complaint, where it cannot be written.
OutputFile openOutput(const std::string& name) {
    OutputFile file(name == "-" ? stdout : std::fopen(name.c_str(), "we"));
    if (file == nullptr) {
        (void)complainAboutOutput(name);
    }
    return file;
}

/// Nothing once all of it is written; else what the command exits with.
std::optional<ExitStatus> finish(std::FILE* file, const std::string& name) {
    const bool isWritten = std::fflush(file) == 0 && std::ferror(file) == 0;
    return isWritten ? std::nullopt : std::optional(complainAboutOutput(name));
}

std::variant<WantedSession, std::string> wantedSession(const Arguments& arguments) {
    WantedSession wanted;
    if (!arguments.rest().empty()) {
        return formatted("record takes no \"{}\"; the file is named with -o", arguments.rest()[0]);
    }
    wanted.name = arguments.last("--session");
    wanted.application = arguments.last("--app");
    if (const auto text = arguments.last("--reporter")) {
        wanted.reporterID = parseNumber<std::int64_t>(*text);
        if (!wanted.reporterID) {
            return notAReporterID(*text);
        }
    }
    return wanted;
}

void say(const std::string& text) {
    std::fprintf(stderr, "%s\n", text.c_str());
}

/// For people, on standard error, as standard output may be the file.
ExitStatus tell(const FoundSession& session, const SessionFileWriter& writer, const RecordingReport& report) {
    say(formatted("{} messages of session {}{}, {} s{}", writer.written(), plainText(Value(session.name)),
                  session.hasOpenLine
                      ? formatted(" of reporter {}, {}", session.reporterID, session.serviceType)
                      : std::string(),
                  fixed(writer.seconds(), 3), writer.leftOut()));
    if (!session.hasOpenLine) {
        say("its beginning is in no file any more: no service type, no configuration, and maybe not all");
    }
    if (!report.hasStopped) {
        say("it has not stopped, or its end is in none of the files");
    }
    if (report.withoutNull != 0) {
        say(formatted("{} messages have values without a JSON form, which are missing", report.withoutNull));
    }
    if (report.passedOver != 0) {
        say(formatted("{} lines of the files are torn or longer than any that the service writes",
                      report.passedOver));
    }
    if (report.unreadable != 0) {
        say(formatted("{} lines of the session cannot be read and are missing", report.unreadable));
    }
    return report.unreadable == 0 && session.hasOpenLine ? ExitStatus::done : ExitStatus::failed;
}

/// What the status has of the reporter's session: of a started one, where several clients have the ID.
std::optional<Dictionary> sessionOf(const Arguments& arguments, std::int64_t reporterID) {
    const auto answer = StatusConnection(arguments).ask(formatted("session {}", reporterID));
    const auto* const document = std::get_if<StatusDocument>(&answer);
    const Value none;
    const Value& sessions = document != nullptr ? (*document)["sessions"] : none;
    std::optional<Dictionary> found;
    for (const Value& session : sessions.arrayValue()) {
        if (session.isDictionary() &&
            (!found || StatusDocument::member(session, "state").stringValue() == "started")) {
            found = session.dictionaryValue();
        }
    }
    return found;
}

ExitStatus tellLive(const LiveRecorder& recorder, const SessionFileWriter& writer, std::int64_t reporterID) {
    say(formatted("{} messages of the session of reporter {}, {}, {} s{}", writer.written(), reporterID,
                  recorder.serviceType(), fixed(writer.seconds(), 3), writer.leftOut()));
    if (!recorder.hasStopped()) {
        say("it has not stopped");
    }
    if (recorder.withoutNull() != 0) {
        say(formatted("{} messages have values without a JSON form, which are missing",
                      recorder.withoutNull()));
    }
    const std::string missing = recorder.missing();
    std::fputs(missing.c_str(), stderr);
    return missing.empty() ? ExitStatus::done : ExitStatus::failed;
}

/// Why there is no tap, when that has come.
std::optional<std::string> refusalOf(const FileDescriptor& tap) {
    std::array<char, 4096> bytes;
    const ssize_t count = ::recv(tap.get(), bytes.data(), bytes.size(), MSG_PEEK | MSG_DONTWAIT);
    const std::string_view text(bytes.data(), static_cast<std::size_t>(std::max<ssize_t>(count, 0)));
    const auto line = parseJsonObject(text.substr(0, text.find('\n')));
    const auto* const record = std::get_if<Dictionary>(&line);
    const Value* const error = record != nullptr ? record->find("error") : nullptr;
    return error != nullptr ? std::optional(plainText(*error)) : std::nullopt;
}

ExitStatus recordLive(const Arguments& arguments, const WantedSession& wanted) {
    if (!wanted.reporterID || wanted.name || wanted.application) {
        return complain(ExitStatus::usage, "--live needs --reporter, and no other choice of a session");
    }
    const std::int64_t reporterID = *wanted.reporterID;
    std::signal(SIGPIPE, SIG_IGN);
    const auto tap = StatusConnection(arguments).send(
        "tap " + jsonText(Dictionary{{"reporter", reporterID}, {"recording", true}}));
    if (const auto* failure = std::get_if<Unreachable>(&tap)) {
        return complain(failure->status, failure->text);
    }
    // An answer to a later request says that the tap is open, or was refused: then the file, which may be
    // another recording's, stays as it is.
    (void)sessionOf(arguments, reporterID);
    if (const auto refusal = refusalOf(std::get<FileDescriptor>(tap))) {
        return complain(ExitStatus::failed, *refusal);
    }
    const std::string name = outputName(arguments);
    const OutputFile file = openOutput(name);
    if (file == nullptr) {
        return ExitStatus::failed;
    }
    SessionFileWriter writer(file.get());
    LiveRecorder recorder(reporterID, writer, [&] { return sessionOf(arguments, reporterID); });
    TapLineFunction take = [&recorder](std::string_view line) { return recorder.take(line); };
    say(formatted("recording the session of reporter {}", reporterID));
    readTap(std::get<FileDescriptor>(tap), file.get(), take);
    if (const auto failure = finish(file.get(), name)) {
        return *failure;
    }
    if (!recorder.hasBegun()) {
        return complain(ExitStatus::failed, "no session was started");
    }
    return tellLive(recorder, writer, reporterID);
}

ExitStatus run(const Arguments& arguments) {
    const auto made = wantedSession(arguments);
    if (const auto* wrong = std::get_if<std::string>(&made)) {
        return complain(ExitStatus::usage, *wrong);
    }
    if (arguments.has("--live")) {
        return recordLive(arguments, std::get<WantedSession>(made));
    }
    const std::string logs = wire::Directories::ofThisProcess().logs;
    if (logs.empty()) {
        return complain(ExitStatus::usage, "the logs directory is not known: set LOGS_DIRECTORY");
    }
    const std::string sinkFile = sinkPath(logs, "call-quality");
    SinkSnapshot sink(sinkFile);
    if (!sink.problem().empty()) {
        complain(ExitStatus::failed, sink.problem());
    }
    if (sink.isEmpty() && !sink.problem().empty()) {
        return ExitStatus::failed;
    }
    if (sink.isEmpty()) {
        return complain(ExitStatus::failed,
                        formatted("there is no {} to read: no session was started yet, or LOGS_DIRECTORY "
                                  "is not the service's",
                                  sinkFile));
    }
    const std::optional<FoundSession> session = findSession(sink, std::get<WantedSession>(made));
    if (!session) {
        return complain(ExitStatus::failed,
                        formatted("no such session in {} and its earlier files; those of service type test "
                                  "are not there",
                                  sinkFile));
    }
    const std::string name = outputName(arguments);
    const OutputFile file = openOutput(name);
    if (file == nullptr) {
        return ExitStatus::failed;
    }
    SessionFileWriter writer(file.get());
    const RecordingReport report = recordSession(sink, *session, writer);
    if (const auto failure = finish(file.get(), name)) {
        return *failure;
    }
    return tell(*session, writer, report);
}

} // namespace

constexpr Command kCommandRecord{
    "record",
    "write a session from the call-quality file, or as it goes on, as one that can be played",
    "[--session NAME | [--live] --reporter ID | --app NAME] [-o FILE]",
    "Of several sessions the last one counts, and without any option the last one of all. The file has a "
    "line that\n"
    "names the session's service type and configuration, and a line for each message, for \"tambloctl "
    "session --play\".\n"
    "What the service makes itself when a session is played is left out: summaries, driver statistics, "
    "features of the\n"
    "device. Repeats are in no sink, and values are as JSON has them: a date or a byte string is a text. "
    "Timestamps of\n"
    "messages are in the call-quality file of internal builds only.\n"
    "\n"
    "With --live messages come from the service itself, with their timestamps, until the session stops or\n"
    "Ctrl-C; one such recording is made at a time, and sessions of several clients under one ID are not "
    "told\n"
    "apart. Exits with 1 when there is no such session, or some of it is missing.",
    kOptions,
    run,
};

} // namespace tamblo::tools
