#include "base/Format.h"
#include "tools/Command.h"
#include "tools/Payload.h"
#include "tools/ServiceConnection.h"

#include <vector>

namespace tamblo::tools {

namespace {

using client::EventCategory;
using client::EventType;

constexpr Option kOptions[] = {
    {"--category", "CATEGORY", "by name (Volume, Session_Playback) or number; needed"},
    {"--type", "TYPE", "by name (Start, Summary) or number (Generic)"},
    {"--reporter", "ID", "the session's reporter; may be given several times"},
    kJsonOption,
    kSocketOption,
    kTimeoutOption,
};

ExitStatus run(const Arguments& arguments) {
    const auto category = client::parseCategory(arguments.last("--category").value_or(""));
    if (!category) {
        return complain(ExitStatus::usage, "--category needs the name of a category, such as Volume or "
                                           "Session_Playback, or its number");
    }
    const auto type = client::parseType(arguments.last("--type").value_or("Generic"));
    if (!type) {
        return complain(ExitStatus::usage, "--type needs the name of a type, such as Start, or its number");
    }
    std::vector<std::int64_t> reporters;
    for (const std::string_view text : arguments.all("--reporter")) {
        const auto reporter = parseReporterID(text);
        if (!reporter) {
            return ExitStatus::usage;
        }
        reporters.push_back(*reporter);
    }
    const auto payload = parsePayload(arguments.rest());
    if (const auto* wrong = std::get_if<std::string>(&payload)) {
        return complain(ExitStatus::usage, *wrong);
    }
    ServiceConnection service(arguments);
    if (!service.connect()) {
        return ExitStatus::unreachable;
    }
    auto future = service.client().sendMessage(std::get<Dictionary>(payload), *category, *type, reporters);
    client::Nothing nothing;
    if (const auto failure = service.await(future, nothing)) {
        return *failure;
    }
    printLine(arguments.has("--json") ? "{\"sent\":true}" : "sent");
    return ExitStatus::done;
}

} // namespace

constexpr Command kCommandSend{
    "send",
    "send one message",
    "--category CATEGORY [--type TYPE] [--reporter ID]... [KEY=VALUE... | JSON]",
    "A value that is a JSON scalar is taken as one; any other is a text. Sessions belong to the connection "
    "that\n"
    "made them, but a message reaches a reporter of any connection. Without a reporter the message goes to "
    "the\n"
    "single-message session, when the payload asks for that with sendSingleMessage=1.",
    kOptions,
    run,
};

} // namespace tamblo::tools
