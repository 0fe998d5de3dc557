#include "base/Format.h"
#include "base/Rfc3339.h"
#include "tools/Command.h"
#include "tools/TimeText.h"
#include "tools/report/Report.h"
#include "wire/Directories.h"

#include <chrono>
#include <cstdio>
#include <filesystem>
#include <optional>
#include <string>
#include <string_view>
#include <variant>
#include <vector>

namespace tamblo::tools {

namespace {

constexpr Option kOptions[] = {
    {.name = "--since",
     .value = "TIME",
     .help = "only sessions that ended after: 2026-03-01, 2026-03-01T12:00:00Z, or 90m, 36h, 7d ago"},
    {.name = "--session",
     .value = "ID",
     .help = "only the sessions of this reporter, or the one of this name in the call-quality file"},
    {.name = "--app", .value = "NAME", .help = "only this application; a trailing * stands for anything"},
    {.name = "--output",
     .value = "FILE",
     .help = "where to write the page, - for standard output (report.html)",
     .letter = 'o'},
};

/// What the options say, in words; empty when they say nothing.
std::string selectionOf(const report::ReportPlan& plan) {
    std::string words;
    const auto add = [&words](std::string_view what, const std::string& value) {
        if (!value.empty()) {
            words.append(words.empty() ? "" : ", ").append(what).append(" ").append(value);
        }
    };
    add("since", plan.wanted.since ? formatRfc3339(*plan.wanted.since).value_or("") : "");
    add("session", plan.wanted.session);
    add("application", plan.wanted.application);
    return words;
}

std::variant<report::ReportPlan, std::string> makePlan(const Arguments& arguments) {
    report::ReportPlan plan;
    plan.now = std::chrono::duration<double>(std::chrono::system_clock::now().time_since_epoch()).count();
    plan.page = arguments.last("--output").value_or("report.html");
    plan.wanted.session = arguments.last("--session").value_or("");
    plan.wanted.application = arguments.last("--app").value_or("");
    plan.directory = wire::Directories::ofThisProcess().logs;
    if (const auto text = arguments.last("--since")) {
        plan.wanted.since = parseMoment(*text, plan.now);
        if (!plan.wanted.since) {
            return formatted("\"{}\" is no time: it is like 2026-03-01, 2026-03-01T12:00:00Z or 7d", *text);
        }
    }
    const std::vector<std::string_view>& rest = arguments.rest();
    if (rest.size() > 1) {
        return std::string("report takes one directory");
    }
    if (!rest.empty()) {
        plan.directory = rest[0];
    }
    if (plan.directory.empty()) {
        return std::string("the logs directory is not known: name it, or set LOGS_DIRECTORY");
    }
    if (plan.page.empty()) {
        return std::string("the page needs a name");
    }
    plan.selection = selectionOf(plan);
    return plan;
}

ExitStatus run(const Arguments& arguments) {
    const auto made = makePlan(arguments);
    if (const auto* wrong = std::get_if<std::string>(&made)) {
        return complain(ExitStatus::usage, *wrong);
    }
    const auto& plan = std::get<report::ReportPlan>(made);
    const auto result = report::makeReport(plan);
    if (const auto* failure = std::get_if<std::string>(&result)) {
        return complain(ExitStatus::failed, *failure);
    }
    const auto& report = std::get<report::ReportResult>(result);
    std::error_code error;
    std::string text = formatted("{} sessions, of {} lines\n", report.sessions, report.lines);
    for (const std::string& line : report.leftOut) {
        text.append("left out: ").append(line).append("\n");
    }
    if (plan.page == "-") {
        std::fputs(text.c_str(), stderr);
    } else {
        const std::string page = std::filesystem::absolute(plan.page, error).lexically_normal().string();
        std::fputs(formatted("{}: {}", page, text).c_str(), stdout);
    }
    return ExitStatus::done;
}

} // namespace

constexpr Command kCommandReport{
    "report",
    "make a page of what the service reported: a timeline of sessions, tables, figures",
    "[--since TIME] [--session ID] [--app NAME] [-o FILE] [DIRECTORY]",
    "Reads the report sinks in DIRECTORY, rotated ones too, and writes one page that a browser opens from\n"
    "the file and that needs nothing else. Without DIRECTORY, the service's logs directory. Times are UTC.",
    kOptions,
    run,
};

} // namespace tamblo::tools
