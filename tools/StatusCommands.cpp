#include "base/Format.h"
#include "base/Json.h"
#include "tools/Command.h"
#include "tools/ServiceConnection.h"
#include "tools/StatusConnection.h"
#include "tools/StatusScreen.h"

#include <string>
#include <utility>
#include <vector>

// The commands that print one document of the status socket.
namespace tamblo::tools {

namespace {

constexpr Option kOptions[] = {kJsonOption, kStatusSocketOption};

/// Prints the document as it is, or as the lines that `render` makes of it.
template <typename Render>
ExitStatus show(const Arguments& arguments, std::string_view request, Render render) {
    const auto answer = StatusConnection(arguments).ask(request);
    if (const auto* const failure = std::get_if<Unreachable>(&answer)) {
        return complain(failure->status, failure->text);
    }
    const auto& document = std::get<StatusDocument>(answer);
    const std::vector<std::string> lines = render(document);
    if (arguments.has("--json")) {
        printLine(std::string_view(document.text).substr(0, document.text.find('\n')));
        return ExitStatus::done;
    }
    for (const std::string& line : lines) {
        printLine(line);
    }
    return ExitStatus::done;
}

template <typename Render>
ExitStatus showAll(const Arguments& arguments, std::string_view request, Render render) {
    if (!arguments.rest().empty()) {
        return complain(ExitStatus::usage, formatted("{} takes no arguments", request));
    }
    return show(arguments, request, render);
}

ExitStatus status(const Arguments& arguments) {
    return showAll(arguments, "status", [&arguments](const StatusDocument& document) {
        const auto clients = arguments.has("--json") ? std::variant<StatusDocument, Unreachable>()
                                                     : StatusConnection(arguments).ask("clients");
        const auto* const known = std::get_if<StatusDocument>(&clients);
        return statusLines(document, known == nullptr ? StatusDocument{} : *known);
    });
}
ExitStatus clients(const Arguments& arguments) {
    return showAll(arguments, "clients", clientLines);
}
ExitStatus sessions(const Arguments& arguments) {
    return showAll(arguments, "sessions", sessionLines);
}

} // namespace

ExitStatus showSession(const Arguments& arguments) {
    if (arguments.rest().size() != 2) {
        return complain(ExitStatus::usage, "session show takes one reporter ID");
    }
    const auto reporter = parseReporterID(arguments.rest()[1]);
    if (!reporter) {
        return ExitStatus::usage;
    }
    bool isFound = false;
    const ExitStatus status =
        show(arguments, formatted("session {}", *reporter), [&isFound](const StatusDocument& document) {
            isFound = !document["sessions"].arrayValue().empty();
            return sessionDetailLines(document);
        });
    if (status == ExitStatus::done && !isFound) {
        return complain(ExitStatus::failed, formatted("nobody has a session of reporter {}", *reporter));
    }
    return status;
}

constexpr Command kCommandStatus{
    "status",
    "how the service is: settings, sinks, limits, the last errors",
    "[--json]",
    "Limits are those that are in use, have been reached, or are not the default; --json has all of them, "
    "and "
    "all\n"
    "counters. docs/status.md, which is tamblo-status(7), says what each means.",
    kOptions,
    status,
};

constexpr Command kCommandClients{
    "clients",  "the clients that are connected",
    "[--json]", "SECONDS is the processor time of a client's requests.",
    kOptions,   clients,
};

constexpr Command kCommandSessions{
    "sessions", "the sessions that clients have",
    "[--json]", "\"tambloctl session show ID\" says more about one.",
    kOptions,   sessions,
};

} // namespace tamblo::tools
