#include "base/Format.h"
#include "tools/Command.h"
#include "tools/Payload.h"
#include "tools/ServiceConnection.h"

#include <vector>

namespace tamblo::tools {

namespace {

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
    if (const auto failure = service.connect()) {
        return *failure;
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
    "A value that is a JSON scalar is taken as one; any other is a text. A message reaches a reporter "
    "whichever\n"
    "client made it. Without a reporter it goes to every started session of every client or, when none is\n"
    "started, to the service's single-message session.",
    kOptions,
    run,
};

} // namespace tamblo::tools
