#include "tools/report/Report.h"

#include "base/Format.h"
#include "os/RandomNumber.h"
#include "tools/report/DeviceEvents.h"
#include "tools/report/EventTwins.h"
#include "tools/report/PageData.h"
#include "tools/report/PageParts.h"
#include "tools/report/SessionCollector.h"

#include <algorithm>
#include <cstring>
#include <filesystem>
#include <system_error>
#include <utility>

namespace tamblo::report {

namespace {

using LineFunction = UniqueFunction<void(std::string_view line)>;

/// Lines that are not what their sink has.
struct OddLines {
    std::uint64_t unreadable = 0; ///< no JSON object
    std::uint64_t unknown = 0;    ///< of a newer version, or of no version
};

/// Reads a line as one of its sink, or counts it.
template <typename Take> void readLine(std::string_view line, OddLines& odd, const Take& take) {
    JsonReader reader(line);
    const JsonItem* const item = reader.readWhole();
    if (item == nullptr || item->kind != JsonItem::Kind::object) {
        ++odd.unreadable;
    } else if (!take(*item)) {
        ++odd.unknown;
    }
}

/// What all sinks say.
struct Collected {
    Collected(const SessionFilter& wanted, std::size_t mostBytes) : sessions(wanted, mostBytes) {}
    SessionCollector sessions;
    DeviceEvents device;
    ReadCounts read;
    OddLines odd;
};

void readSinks(const std::string& directory, Collected& all) {
    const auto read = [&all](const SinkFiles& files, auto take) {
        LineFunction line = [&](std::string_view text) { readLine(text, all.odd, take); };
        files.read(all.read, line);
    };
    const auto open = [&](std::string_view name) { return SinkFiles(directory, name, all.read); };
    // A message is an event first, and a call-quality line later: in this order few events are without one.
    const SinkFiles events = open("analytics-events.jsonl");
    read(open("call-quality.jsonl"),
         [&](const JsonItem& line) { return all.sessions.takeCallQuality(line); });
    all.sessions.finishCallQuality();
    EventTwins::Take event = [&](std::string_view text, std::string_view service) {
        readLine(text, all.odd, [&](const JsonItem& line) { return all.sessions.takeEvent(line, service); });
    };
    EventTwins twins(event);
    LineFunction line = [&twins](std::string_view text) { twins.add(text); };
    events.read(all.read, line);
    twins.finish();
    all.sessions.finish();
    read(open("bug-captures.jsonl"), [&](const JsonItem& item) { return all.device.takeCapture(item); });
    read(open("stack-captures.jsonl"),
         [&](const JsonItem& item) { return all.device.takeStackCapture(item); });
    read(open("bug-report-drafts.jsonl"), [&](const JsonItem& item) { return all.device.takeDraft(item); });
}

std::vector<std::string> leftOutOf(const Collected& all) {
    std::vector<std::string> lines;
    const auto say = [&lines](std::uint64_t count, std::string_view what) {
        if (count > 0) {
            lines.push_back(formatted("{} {}", count, what));
        }
    };
    const LeftOut& leftOut = all.sessions.leftOut();
    say(leftOut.sessions, "of the oldest sessions, beyond the memory that a report may take");
    say(leftOut.facts, "changes and marks of sessions with more than 5000");
    say(leftOut.summaries, "summaries of sessions with more than 1000");
    say(all.sessions.keys().leftOut(),
        "times a payload key, beyond the first 2048 or of more than 100 bytes");
    say(all.device.leftOut(), "of the oldest captures and drafts, beyond 10000");
    say(all.read.tornLines, "lines without an end: torn, or just being written");
    say(all.read.longLines, "lines of more than 1 MiB");
    say(all.odd.unreadable, "lines that are no JSON object");
    say(all.odd.unknown, "lines that are not understood: of a newer version of the service, or not its own");
    for (const std::string& name : all.read.unreadable) {
        lines.push_back(formatted("{}, which cannot be read", name));
    }
    return lines;
}

/// From the page's directory, so that both can be moved together; with a slash behind it.
std::string folderFrom(const std::string& page, const std::string& directory) {
    namespace fs = std::filesystem;
    std::error_code error;
    const fs::path from = fs::absolute(page, error).parent_path();
    const fs::path folder = fs::relative(fs::absolute(directory, error) / "captures", from, error);
    return (error ? directory + "/captures" : folder.string()) + "/";
}

/// The names of captures whose folders are there.
std::vector<std::string> captureFolders(const std::string& directory) {
    namespace fs = std::filesystem;
    std::vector<std::string> names;
    std::error_code error;
    for (fs::directory_iterator entry(directory + "/captures", error), end; !error && entry != end;
         entry.increment(error)) {
        if (entry->is_directory(error) && names.size() < DeviceEvents::kMost) {
            names.push_back(entry->path().filename().string());
        }
    }
    std::ranges::sort(names);
    return names;
}

/// Writes the page, with each `{{NAME}}` of its frame replaced.
void writePage(PageWriter& out, const PageData& data) {
    // Only what stands here from the start is run: markup that came in by way of the data cannot know this.
    const std::string nonce =
        formatted("{}{}", hexadecimal(randomNumber(), 16), hexadecimal(randomNumber(), 16));
    std::string_view rest = page_parts::page_html;
    for (std::size_t at = rest.find("{{"); at != std::string_view::npos; at = rest.find("{{")) {
        const std::size_t end = rest.find("}}", at);
        const std::string_view name = rest.substr(at + 2, end - at - 2);
        out.text(rest.substr(0, at));
        rest.remove_prefix(end + 2);
        if (name == "nonce") {
            out.text(nonce);
        } else if (name == "style") {
            out.text(page_parts::page_css);
        } else if (name == "script") {
            for (const std::string_view part :
                 {page_parts::plots_js, page_parts::data_js, page_parts::details_js, page_parts::timeline_js,
                  page_parts::timeline_input_js, page_parts::timeline_rows_js, page_parts::figures_js,
                  page_parts::page_js}) {
                out.text(part);
            }
        } else {
            writePageData(out, data);
        }
    }
    out.text(rest);
}

} // namespace

std::variant<ReportResult, std::string> makeReport(const ReportPlan& plan) {
    std::error_code error;
    if (!std::filesystem::is_directory(plan.directory, error)) {
        return formatted("there is no directory {}", plan.directory);
    }
    Collected all(plan.wanted, plan.mostBytes);
    readSinks(plan.directory, all);
    if (all.read.files == 0) {
        return formatted("{} has no sink that can be read", plan.directory);
    }
    PageData data{.made = plan.now,
                  .selection = plan.selection,
                  .captureFolder = folderFrom(plan.page, plan.directory),
                  .read = all.read,
                  .leftOut = leftOutOf(all),
                  .sessions = {},
                  .device = all.device.events(),
                  .keys = all.sessions.keys().names(),
                  .folders = captureFolders(plan.directory)};
    for (const auto& [serial, session] : all.sessions.sessions()) {
        data.sessions.push_back(&session);
    }
    std::erase_if(data.device, [since = plan.wanted.since](const DeviceEvent& event) {
        return since && event.time < *since;
    });
    std::ranges::sort(data.sessions, {},
                      [](const Session* session) { return std::pair(session->began, session->serial); });
    PageWriter page(plan.page);
    if (page.error() == 0) {
        writePage(page, data);
    }
    if (page.error() != 0 || page.finish() != 0) {
        return formatted("cannot write {}: {}", plan.page, std::strerror(page.error()));
    }
    return ReportResult{data.sessions.size(), all.read.lines, data.leftOut};
}

} // namespace tamblo::report
