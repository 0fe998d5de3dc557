#include "os/PreferenceFile.h"

#include "base/Format.h"
#include "base/Json.h"
#include "os/Directory.h"
#include "os/ReplaceFile.h"
#include "os/SmallFile.h"

#include <cerrno>
#include <system_error>

namespace tamblo {

namespace {

/// Bytes of a domain's name: with the suffix, it has to be a file system's file name.
constexpr std::size_t kLongestDomainName = 200;

std::string systemFault(const std::string& path, int error) {
    return formatted("{}: {}", path, std::generic_category().message(error));
}

} // namespace

std::optional<PreferenceFile> PreferenceFile::of(std::string directory, std::string_view domain) {
    if (domain.empty() || domain.size() > kLongestDomainName || domain.front() == '.' ||
        domain.find_first_of(std::string_view("/\0", 2)) != std::string_view::npos) {
        return std::nullopt;
    }
    std::string path = formatted("{}/{}{}", directory, domain, kSuffix);
    return PreferenceFile(std::move(directory), std::move(path));
}

std::variant<Dictionary, std::string> PreferenceFile::read() const {
    const SmallFile file = SmallFile::read(path_, kMaximumSize);
    if (file.error != 0) {
        return file.error == ENOENT ? std::variant<Dictionary, std::string>(Dictionary())
                                    : formatted("{}: {}", path_, file.reason());
    }
    const auto read = readJson(file.text);
    if (const auto* error = std::get_if<JsonError>(&read)) {
        return formatted("{}: line {}, column {}: {}; it is left as it is", path_, error->line, error->column,
                         error->message);
    }
    const Value& value = std::get<Value>(read);
    if (!value.isDictionary()) {
        return formatted("{}: not an object; it is left as it is", path_);
    }
    return value.dictionaryValue();
}

std::optional<std::string> PreferenceFile::edit(const std::function<bool(Dictionary&)>& change,
                                                std::optional<std::chrono::milliseconds> patience) const {
    const FileDescriptor lock = lockDirectory(directory_, patience);
    if (!lock.isOpen()) {
        return errno == EWOULDBLOCK ? formatted("{}: another program has it locked", directory_)
                                    : systemFault(directory_, errno);
    }
    auto content = read();
    if (auto* fault = std::get_if<std::string>(&content)) {
        return std::move(*fault);
    }
    auto& values = std::get<Dictionary>(content);
    if (!change(values)) {
        return std::nullopt;
    }
    const std::string text = jsonText(values) + "\n";
    if (text.size() > kMaximumSize || std::holds_alternative<JsonError>(readJson(text))) {
        return formatted("{}: too large or too deeply nested to be read again; it is left as it is", path_);
    }
    const int failure = replaceFileAtomically(path_, text, Durability::power);
    return failure != 0 ? std::optional(systemFault(path_, failure)) : std::nullopt;
}

} // namespace tamblo
