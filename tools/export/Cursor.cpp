#include "tools/export/Cursor.h"

#include "base/Format.h"
#include "base/Json.h"
#include "os/ReplaceFile.h"
#include "os/SmallFile.h"
#include "tools/records/Payload.h"

#include <cerrno>
#include <cstddef>
#include <cstring>
#include <utility>

#include <fcntl.h>
#include <sys/file.h>

namespace tamblo::tools {

namespace {

/// It has some ranges for each of some forty files.
constexpr std::size_t kMostBytes = 4U << 20U;
constexpr int kVersion = 1;

const Value& member(const Value& object, std::string_view key) {
    static const Value none;
    const Value* const found = object.dictionaryValue().find(key);
    return found == nullptr ? none : *found;
}

FileProgress readFile(const Value& object) {
    FileProgress file{.identity = std::string(member(object, "file").stringValue()),
                      .counted = member(object, "bytes").unsignedValue(),
                      .tail = std::string(member(object, "tail").stringValue()),
                      .written = member(object, "written").integerValue(),
                      .lines = member(object, "lines").unsignedValue(),
                      .takenLines = member(object, "lines_taken").unsignedValue(),
                      .taken = {}};
    std::uint64_t behind = 0;
    for (const Value& range : member(object, "taken").arrayValue()) {
        const auto ends = range.arrayValue();
        const Range read =
            ends.size() == 2 ? Range{ends[0].unsignedValue(), ends[1].unsignedValue()} : Range{};
        // A range out of order is somebody's mistake: what it names is exported again.
        if (read.begin >= behind && read.begin < read.end && read.end <= file.counted) {
            file.taken.push_back(read);
            behind = read.end + 1;
        }
    }
    return file;
}

Value valueOf(const FileProgress& file) {
    Array taken;
    for (const Range& range : file.taken) {
        taken.emplace_back(Array{Value(range.begin), Value(range.end)});
    }
    return Dictionary{{"file", file.identity},    {"bytes", file.counted}, {"tail", file.tail},
                      {"written", file.written},  {"lines", file.lines},   {"lines_taken", file.takenLines},
                      {"taken", std::move(taken)}};
}

} // namespace

std::variant<Cursor, std::string> Cursor::open(const std::string& path, std::string_view device) {
    if (path.empty()) {
        return std::string("the cursor's file has no name");
    }
    Cursor cursor;
    cursor.path_ = path;
    cursor.device_ = device;
    // The file itself is replaced, and with it what is locked.
    const std::string lock = path + ".lock";
    cursor.lock_ = FileDescriptor(::open(lock.c_str(), O_RDWR | O_CREAT | O_CLOEXEC, S_IRUSR | S_IWUSR));
    if (!cursor.lock_.isOpen()) {
        return formatted("cannot write {}: {}", lock, std::strerror(errno));
    }
    if (::flock(cursor.lock_.get(), LOCK_EX | LOCK_NB) != 0) {
        return formatted("another export goes on from {}", path);
    }
    const SmallFile file = SmallFile::read(path, kMostBytes);
    if (file.isMissing()) {
        return cursor;
    }
    if (file.error != 0) {
        return formatted("cannot read {}: {}", path, file.reason());
    }
    const auto read = parseJsonObject(file.text);
    if (const auto* const wrong = std::get_if<std::string>(&read)) {
        return formatted("{} is {}; remove it to export everything again", path, *wrong);
    }
    const Value document(std::get<Dictionary>(read));
    if (member(document, "version").integerValue() != kVersion) {
        return formatted("{} is no cursor of this version; remove it to export everything again", path);
    }
    cursor.wasOfOtherDevice_ = member(document, "device").stringValue() != device;
    cursor.spent_ = {member(document, "day").integerValue(), member(document, "day_bytes").unsignedValue()};
    const Dictionary& written = member(document, "written").dictionaryValue();
    for (std::size_t i = 0; i != written.size(); ++i) {
        const Value& count = written.valueAt(i);
        cursor.setWritten(written.keyAt(i), {.began = member(count, "began").unsignedValue(),
                                             .lines = member(count, "lines").unsignedValue()});
    }
    const Dictionary& sinks = member(document, "sinks").dictionaryValue();
    for (std::size_t i = 0; i != sinks.size(); ++i) {
        for (const Value& entry : sinks.valueAt(i).arrayValue()) {
            cursor.sinks_[std::string(sinks.keyAt(i))].push_back(readFile(entry));
        }
    }
    return cursor;
}

SinkProgress Cursor::progress(std::string_view sink) const {
    const auto found = sinks_.find(sink);
    return found == sinks_.end() ? SinkProgress() : found->second;
}

void Cursor::set(std::string_view sink, const SinkProgress& progress) {
    sinks_[std::string(sink)] = progress;
}

std::optional<WrittenLines> Cursor::written(std::string_view sink) const {
    const auto found = written_.find(sink);
    return found == written_.end() ? std::nullopt : std::optional(found->second);
}

void Cursor::setWritten(std::string_view sink, const WrittenLines& written) {
    written_[std::string(sink)] = written;
}

std::optional<std::string> Cursor::store() const {
    if (path_.empty()) {
        return std::nullopt;
    }
    Dictionary sinks;
    for (const auto& [name, progress] : sinks_) {
        Array files;
        for (const FileProgress& file : progress) {
            files.push_back(valueOf(file));
        }
        sinks.set(name, std::move(files));
    }
    Dictionary written;
    for (const auto& [name, count] : written_) {
        written.set(name, Dictionary{{"began", count.began}, {"lines", count.lines}});
    }
    const Dictionary document{{"version", kVersion},       {"device", device_},
                              {"day", spent_.day},         {"day_bytes", spent_.bytes},
                              {"sinks", std::move(sinks)}, {"written", std::move(written)}};
    const int error = replaceFileAtomically(path_, jsonText(document) + "\n", Durability::power);
    return error == 0 ? std::nullopt
                      : std::optional(formatted("cannot write {}: {}", path_, std::strerror(error)));
}

} // namespace tamblo::tools
