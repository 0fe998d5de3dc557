#include "SinkReader.h"

#include "base/Json.h"
#include "os/FileDescriptor.h"

#include <algorithm>
#include <cstdio>
#include <optional>
#include <variant>
#include <vector>

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

namespace tamblo::bench {

namespace {

/// More than the service keeps.
constexpr int kMostFiles = 9;
constexpr std::string_view kClientPrefix = "client-";

std::optional<SinkRecord> recordOf(const Dictionary& line, Sink sink) {
    const Value* const payload = line.find("payload");
    if (payload == nullptr || !payload->isDictionary()) {
        return std::nullopt;
    }
    const Dictionary& entries = payload->dictionaryValue();
    const bool isEvent = sink == Sink::analyticsEvents;
    const Value* const number = entries.find(isEvent ? "number" : "EngineOnDuration");
    const Value* const client = entries.find(isEvent ? "client" : "ApplicationName");
    if (number == nullptr || client == nullptr || !client->isString() ||
        client->stringValue().size() != kClientPrefix.size() + 1) {
        return std::nullopt;
    }
    return SinkRecord{static_cast<std::size_t>(client->stringValue().back() - '0'),
                      static_cast<std::uint64_t>(number->doubleValue())};
}

} // namespace

SinkReader::SinkReader(const std::string& logsDirectory, Sink sink)
    : path_(logsDirectory +
            (sink == Sink::analyticsEvents ? "/analytics-events.jsonl" : "/power-events.jsonl")),
      sink_(sink) {}

bool SinkReader::isTorn() const {
    const FileDescriptor file(::open(path_.c_str(), O_RDONLY | O_CLOEXEC));
    struct stat status {};
    char last = '\n';
    return file.isOpen() && ::fstat(file.get(), &status) == 0 && status.st_size > 0 &&
           ::pread(file.get(), &last, 1, status.st_size - 1) == 1 && last != '\n';
}

void SinkReader::read(const std::function<void(const SinkRecord&)>& found) {
    for (int number = kMostFiles; number > 0; --number) {
        const std::string path = path_ + "." + std::to_string(number);
        struct stat status {};
        if (::stat(path.c_str(), &status) == 0) {
            readFile(path, found);
            readTo_.erase(status.st_ino);
            ::unlink(path.c_str());
            ++rotations_;
        }
    }
    readFile(path_, found);
}

void SinkReader::readFile(const std::string& path, const std::function<void(const SinkRecord&)>& found) {
    constexpr std::size_t kBlock = 1U << 20U;
    const FileDescriptor file(::open(path.c_str(), O_RDONLY | O_CLOEXEC));
    struct stat status {};
    if (!file.isOpen() || ::fstat(file.get(), &status) != 0) {
        return;
    }
    off_t& at = readTo_[status.st_ino];
    at = std::min(at, status.st_size);
    std::string rest;
    std::vector<char> block(kBlock);
    for (;;) {
        // A hole was made to make the file long.
        const off_t data = ::lseek(file.get(), at, SEEK_DATA);
        at = data < 0 ? status.st_size : data;
        const ssize_t count = ::pread(file.get(), block.data(), block.size(), at);
        if (count <= 0) {
            break;
        }
        at += count;
        std::string_view bytes(block.data(), static_cast<std::size_t>(count));
        for (std::size_t end = bytes.find('\n'); end != bytes.npos; end = bytes.find('\n')) {
            rest.append(bytes.substr(0, end));
            readLine(rest, found);
            rest.clear();
            bytes.remove_prefix(end + 1);
        }
        rest.append(bytes);
    }
    // Zeros behind the last line were made to make the file long, and no line fitted in behind them.
    if (const std::size_t begin = rest.find_first_not_of('\0'); begin != rest.npos) {
        std::fprintf(stderr, "tamblo_crash: half a line at the end of %s: %.200s\n", path.c_str(),
                     rest.c_str() + begin);
        ++broken_;
    }
}

void SinkReader::readLine(std::string_view line, const std::function<void(const SinkRecord&)>& found) {
    line.remove_prefix(std::min(line.find_first_not_of('\0'), line.size()));
    const auto read = readJson(line);
    const auto* const value = std::get_if<Value>(&read);
    const auto record =
        value != nullptr && value->isDictionary() ? recordOf(value->dictionaryValue(), sink_) : std::nullopt;
    if (!record) {
        std::fprintf(stderr, "tamblo_crash: broken line in %s: %.200s\n", path_.c_str(),
                     std::string(line).c_str());
        ++broken_;
        return;
    }
    found(*record);
}

} // namespace tamblo::bench
