#include "base/Format.h"
#include "base/Json.h"
#include "os/Directory.h"
#include "os/PreferenceFile.h"
#include "tools/Command.h"
#include "tools/KnownSettings.h"
#include "tools/records/AccessFault.h"
#include "wire/Directories.h"

#include <cerrno>
#include <functional>
#include <optional>
#include <string>

namespace tamblo::tools {

namespace {

using Words = std::span<const std::string_view>;

constexpr Option kOptions[] = {
    {.name = "--force", .value = "", .help = "set what the service would not take, too"},
};

/// The JSON that the text is, else the text itself.
Value valueOf(std::string_view text) {
    const auto json = readJson(text);
    const Value* const value = std::get_if<Value>(&json);
    return value != nullptr ? *value : Value(text);
}

/// What went wrong with the file, with its owner where that is what stands in the way.
ExitStatus complainOfFile(const PreferenceFile& file, std::string_view fault) {
    const bool isDenied = faultOfReading(file.path()) == EACCES;
    return complain(ExitStatus::failed, isDenied ? formatted("cannot read {}: {}", file.path(),
                                                             describeFault(EACCES, file.path()))
                                                 : std::string(fault));
}

ExitStatus complainOfKey(const PreferenceFile& file, std::string_view key) {
    return complain(ExitStatus::failed, formatted("{} has no key \"{}\"", file.path(), key));
}

ExitStatus get(const PreferenceFile& file, Words rest) {
    const auto content = file.read();
    if (const auto* fault = std::get_if<std::string>(&content)) {
        return complainOfFile(file, *fault);
    }
    const auto& values = std::get<Dictionary>(content);
    const Value* const value = rest.empty() ? nullptr : values.find(rest[0]);
    if (!rest.empty() && value == nullptr) {
        return complainOfKey(file, rest[0]);
    }
    printLine(rest.empty() ? jsonText(values) : jsonText(*value));
    return ExitStatus::done;
}

ExitStatus edit(const PreferenceFile& file, const std::function<bool(Dictionary&)>& change) {
    const auto fault = file.edit(change);
    return fault ? complainOfFile(file, *fault) : ExitStatus::done;
}

/// The status to exit with for a value that the service would not take; a note on a key that it does not
/// read.
std::optional<ExitStatus> check(std::string_view domain, std::string_view key, const Value& value) {
    const KnownPreference* const known = findKnownPreference(domain, key);
    if (known != nullptr && !isOfKind(known->kind, value)) {
        return complain(ExitStatus::usage,
                        formatted("{} {} is {}, not {}; nothing was changed (--force sets it)", domain, key,
                                  describe(known->kind), jsonText(value)));
    }
    if (known == nullptr && isServiceDomain(domain)) {
        complain(ExitStatus::done, formatted("note: the service reads no \"{}\" of {}; \"tambloctl list "
                                             "preferences\" has what it reads",
                                             key, domain));
    }
    return std::nullopt;
}

ExitStatus set(const PreferenceFile& file, std::string_view key, const Value& value) {
    return edit(file, [&](Dictionary& values) {
        values.set(key, value);
        return true;
    });
}

ExitStatus unset(const PreferenceFile& file, std::string_view key) {
    bool wasThere = false;
    const ExitStatus status = edit(file, [&](Dictionary& values) { return wasThere = values.remove(key); });
    return status == ExitStatus::done && !wasThere ? complainOfKey(file, key) : status;
}

ExitStatus run(const Arguments& arguments) {
    const Words words = arguments.rest();
    const std::string_view act = words.empty() ? "" : words[0];
    const bool isGet = act == "get" && (words.size() == 2 || words.size() == 3);
    const bool isSet = act == "set" && words.size() == 4;
    const bool isUnset = act == "unset" && words.size() == 3;
    if (!isGet && !isSet && !isUnset) {
        return complain(ExitStatus::usage, "preference needs: get DOMAIN [KEY], set DOMAIN KEY VALUE, or "
                                           "unset DOMAIN KEY");
    }
    const auto directories = wire::Directories::ofThisProcess();
    if (directories.configuration.empty()) {
        return complain(ExitStatus::failed,
                        "the configuration directory is not known: set CONFIGURATION_DIRECTORY");
    }
    const auto file = PreferenceFile::of(directories.preferences(), words[1]);
    if (!file) {
        return complain(ExitStatus::failed, formatted("\"{}\" is no preferences domain", words[1]));
    }
    if (isGet) {
        return get(*file, words.subspan(2));
    }
    const Value value = isSet ? valueOf(words[3]) : Value(false);
    if (isSet && !arguments.has("--force")) {
        if (const auto failure = check(words[1], words[2], value)) {
            return *failure;
        }
    }
    if (const int failure = makeDirectories(directories.preferences())) {
        return complain(ExitStatus::failed, formatted("cannot create {}: {}", directories.preferences(),
                                                      describeFault(failure, directories.preferences())));
    }
    return isSet ? set(*file, words[2], value) : unset(*file, words[2]);
}

} // namespace

constexpr Command kCommandPreference{
    "preference",
    "read or change the service's preferences",
    "get DOMAIN [KEY] | set DOMAIN KEY VALUE | unset DOMAIN KEY",
    "A VALUE that is JSON is taken as such (true, 5, [\"a\",\"b\"]); any other is a text. What is printed is "
    "JSON.\n"
    "A file that is not a JSON object is not touched, and a value of a kind that the service does not take "
    "for the\n"
    "key is refused; \"tambloctl list preferences\" has the keys.",
    kOptions,
    run,
};

} // namespace tamblo::tools
