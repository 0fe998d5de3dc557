#include "platform/linux/settings/JsonFile.h"

#include "base/Format.h"
#include "base/Json.h"
#include "os/FileDescriptor.h"

#include <cerrno>
#include <system_error>
#include <utility>
#include <variant>

#include <fcntl.h>
#include <sys/stat.h>

namespace tamblo {

namespace {

/// Reads a file up to a size. Returns 0 or an `errno`.
int readUpTo(int descriptor, std::size_t maximum, std::string& content) {
    content.resize(maximum);
    std::size_t filled = 0;
    while (filled < content.size()) {
        const ssize_t count = ::read(descriptor, content.data() + filled, content.size() - filled);
        if (count < 0 && errno == EINTR) {
            continue;
        }
        if (count < 0) {
            return errno;
        }
        if (count == 0) {
            break;
        }
        filled += static_cast<std::size_t>(count);
    }
    content.resize(filled);
    return 0;
}

std::string systemError(int number) {
    return std::generic_category().message(number);
}

} // namespace

std::optional<Dictionary> JsonFile::read(StructuredLog& log) {
    const std::optional<std::string> text = readText(log);
    if (!text) {
        return std::nullopt;
    }
    const std::variant<Value, JsonError> read = readJson(*text);
    if (const JsonError* error = std::get_if<JsonError>(&read)) {
        report(log, *error);
        return std::nullopt;
    }
    const Value& value = std::get<Value>(read);
    if (!value.isDictionary()) {
        report(log, JsonError{1, 1, "not an object"});
        return std::nullopt;
    }
    reportedFault_.clear();
    return value.dictionaryValue();
}

bool JsonFile::readArray(const std::function<void(const JsonItem&)>& take, StructuredLog& log) {
    const std::optional<std::string> text = readText(log);
    if (!text) {
        return false;
    }
    JsonReader reader(*text);
    while (const JsonItem* element = reader.readElement()) {
        if (element->kind != JsonItem::Kind::null) {
            take(*element);
        }
    }
    if (reader.error()) {
        report(log, *reader.error());
        return false;
    }
    reportedFault_.clear();
    return true;
}

std::optional<std::string> JsonFile::readText(StructuredLog& log) {
    state_ = {};
    // Not blocking, or a pipe of that name would hold up the service until somebody writes into it.
    const FileDescriptor file(::open(path_.c_str(), O_RDONLY | O_CLOEXEC | O_NONBLOCK | O_NOCTTY));
    if (!file.isOpen()) {
        if (errno == ENOENT || errno == ENOTDIR) {
            reportedFault_.clear();
        } else {
            report(log, systemError(errno));
        }
        return std::nullopt;
    }
    struct stat status {};
    if (::fstat(file.get(), &status) != 0 || !S_ISREG(status.st_mode)) {
        report(log, "not a regular file");
        return std::nullopt;
    }
    state_ = FileState::of(status);
    std::string content;
    const std::size_t size = static_cast<std::size_t>(status.st_size);
    const int failure = size > maximumSize_ ? EFBIG : readUpTo(file.get(), size, content);
    if (failure != 0) {
        report(log, systemError(failure));
        return std::nullopt;
    }
    return content;
}

void JsonFile::report(StructuredLog& log, const JsonError& error) {
    report(log, formatted("line {}, column {}: {}", error.line, error.column, error.message));
}

void JsonFile::report(StructuredLog& log, std::string_view fault) {
    if (state_ == reportedState_ && fault == reportedFault_) {
        return;
    }
    reportedState_ = state_;
    reportedFault_ = fault;
    log.report(LogLevel::error, "zrrs", formatted("{}: {}; nothing of it is used", path_, fault));
}

} // namespace tamblo
