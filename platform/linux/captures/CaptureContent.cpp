#include "platform/linux/captures/CaptureContent.h"

#include "base/Format.h"
#include "base/Utf8.h"
#include "os/Directory.h"
#include "os/SmallFile.h"

#include <algorithm>
#include <system_error>
#include <utility>

namespace tamblo {

namespace {

/// The kernel's files have a page or two. `smaps_rollup` and `status` are no longer with many mappings.
constexpr std::size_t kMaximumFile = 64UL << 10U;
/// Thermal zones and cooling devices, of which a machine has some ten or twenty; each is two files to read.
constexpr std::size_t kMaximumZones = 256;

/// A file of the kernel's under a heading, or why there is none.
void appendFile(std::string& text, std::string_view heading, const std::string& path) {
    const SmallFile file = SmallFile::read(path, kMaximumFile);
    appendFormatted(text, "== {}\n", heading);
    if (file.error != 0) {
        appendFormatted(text, "({})", std::generic_category().message(file.error));
    }
    text += file.text;
    text += file.text.ends_with('\n') ? "\n" : "\n\n";
}

/// What a process calls itself must neither make lines of its own here nor reach a terminal.
std::string withoutControls(std::string text, std::string_view kept = {}) {
    for (std::size_t at = 0; at < text.size(); ++at) {
        if (kept.find(text[at]) == kept.npos) {
            const std::size_t length = controlLength(text, at);
            text.replace(at, length, length, '?');
        }
    }
    return text;
}

std::string requestText(const CaptureRequest& request, WallTime now) {
    TextBuffer text;
    {
        SinkLine line(text, request.time);
        addRequest(line, request);
        line.number("gathered", secondsSince1970(now));
    }
    text.append('\n');
    return std::string(text.view());
}

} // namespace

void addRequest(JsonObject& line, const CaptureRequest& request) {
    line.text("op", request.operation)
        .text("session", request.identifier)
        .object("signature",
                [&signature = request.signature](JsonObject& fields) {
                    fields.text("domain", signature.domain)
                        .text("type", signature.type)
                        .text("subType", signature.subType)
                        .text("subTypeContext", signature.subTypeContext)
                        .text("detectedProcess", signature.detectedProcess);
                })
        .number("duration", request.duration.count())
        .value("payload", request.payload);
}

std::vector<CaptureFile> CaptureContent::gather(const CaptureRequest& request, WallTime now) const {
    std::vector<CaptureFile> files;
    files.reserve(request.processes.size() + 2);
    // First what changes fastest.
    for (const pid_t process : request.processes) {
        files.push_back({formatted("process-{}.txt", process), processText(process)});
    }
    files.push_back({"system.txt", systemText()});
    files.push_back({"capture.json", requestText(request, now)});
    return files;
}

std::string CaptureContent::processText(pid_t process) const {
    const std::optional<std::string> name = files_.name(process);
    if (!name) {
        return formatted("process {}: gone\n", process);
    }
    std::string text = formatted("process {}: {}\n\n== threads\n", process, withoutControls(*name));
    std::vector<pid_t> threads = files_.threads(process, kMaximumThreads);
    std::ranges::sort(threads);
    for (const pid_t thread : threads) {
        appendThread(text, process, thread);
    }
    if (threads.size() == kMaximumThreads) {
        appendFormatted(text, "(no more than {} threads are shown)\n", kMaximumThreads);
    }
    text += '\n';
    const std::string folder = formatted("{}/{}", processRoot_, process);
    appendFile(text, "status", folder + "/status");
    appendFile(text, "memory", folder + "/smaps_rollup");
    return withoutControls(std::move(text), "\n\t");
}

/// One line, and one for each call in the kernel.
void CaptureContent::appendThread(std::string& text, pid_t process, pid_t thread) const {
    const auto sample = files_.sampleThread(process, thread);
    if (!sample) {
        appendFormatted(text, "{}  gone\n", thread);
        return;
    }
    appendFormatted(text, "{}  {}  {}  {}\n", thread,
                    withoutControls(files_.threadName(process, thread).value_or("-")), sample->state,
                    sample->waitChannel.value_or("-"));
    for (const std::string& call : sample->kernelStack.value_or(std::vector<std::string>())) {
        appendFormatted(text, "        {}\n", call);
    }
}

std::string CaptureContent::systemText() const {
    std::string text;
    for (const char* file : {"loadavg", "pressure/cpu", "pressure/io", "pressure/memory", "meminfo"}) {
        appendFile(text, file, formatted("{}/{}", processRoot_, file));
    }
    appendTemperatures(text);
    return text;
}

/// Thousandths of a degree Celsius, as the kernel has them.
void CaptureContent::appendTemperatures(std::string& text) const {
    text += "== temperatures\n";
    const std::string directory = systemRoot_ + "/class/thermal";
    std::vector<std::string> zones = DirectoryEntries::read(directory, kMaximumZones).names;
    std::erase_if(zones, [](const std::string& name) { return !name.starts_with("thermal_zone"); });
    std::ranges::sort(zones);
    for (const std::string& zone : zones) {
        const SmallFile type = SmallFile::read(formatted("{}/{}/type", directory, zone), kMaximumFile);
        const SmallFile degrees = SmallFile::read(formatted("{}/{}/temp", directory, zone), kMaximumFile);
        appendFormatted(text, "{}  {}  {}\n", zone, type.trimmed(),
                        degrees.error == 0
                            ? std::string(degrees.trimmed())
                            : formatted("({})", std::generic_category().message(degrees.error)));
    }
    text += zones.empty() ? "(none)\n" : "";
}

} // namespace tamblo
