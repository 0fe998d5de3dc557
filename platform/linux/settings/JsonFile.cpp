#include "platform/linux/settings/JsonFile.h"

#include "base/Format.h"
#include "base/Json.h"
#include "os/SmallFile.h"

#include <cerrno>
#include <variant>

#include <sys/stat.h>

namespace tamblo {

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
    report(log, "");
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
    report(log, "");
    return true;
}

std::optional<std::string> JsonFile::readText(StructuredLog& log) {
    SmallFile file = SmallFile::read(path_, maximumSize_);
    state_ = file.state;
    isCertain_ = file.isStateOld;
    // What is too large, or no file, holds nothing; anything else has been kept from being read.
    const bool isRubbish = file.error == EFBIG || file.error == EISDIR || file.error == EINVAL;
    isUnreadable_ = file.error != 0 && !file.isMissing() && !isRubbish;
    if (file.error != 0) {
        report(log, file.isMissing() ? "" : file.reason(),
               isUnreadable_ ? "what was known of it stays until it can be read" : kNotUsed);
        return std::nullopt;
    }
    return std::move(file.text);
}

bool JsonFile::isCurrent() const noexcept {
    struct stat status {};
    return isCertain_ && ::stat(path_.c_str(), &status) == 0 && isCurrent(FileState::of(status));
}

void JsonFile::report(StructuredLog& log, const JsonError& error) {
    report(log, formatted("line {}, column {}: {}", error.line, error.column, error.message));
}

void JsonFile::report(StructuredLog& log, std::string_view fault, std::string_view consequence) {
    if (told_.isNews(fault, state_)) {
        log.report(LogLevel::error, "zrrs", formatted("{}: {}; {}", path_, fault, consequence));
    }
}

} // namespace tamblo
