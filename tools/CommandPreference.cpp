#include "base/Format.h"
#include "base/Json.h"
#include "client/Directories.h"
#include "tools/Command.h"
#include "tools/Files.h"
#include "tools/Payload.h"

#include <cerrno>
#include <cstring>
#include <string>

#include <unistd.h>

namespace tamblo::tools {

namespace {

/// One domain's file.
struct Domain {
    std::string directory;
    std::string path;
    Dictionary content;
};

/// Reads the domain's file; a missing one is empty, any other fault is a line that says what is wrong.
std::variant<Domain, std::string> load(const std::string& name) {
    if (name.empty() || name.find('/') != std::string::npos || name.starts_with('.')) {
        return formatted("\"{}\" is no preferences domain", name);
    }
    const client::Directories directories = client::Directories::ofThisProcess();
    if (directories.configuration.empty()) {
        return std::string("the configuration directory is not known: set CONFIGURATION_DIRECTORY");
    }
    Domain domain{.directory = directories.preferences(), .path = {}, .content = {}};
    domain.path = domain.directory + "/" + name + ".json";
    const auto text = readFile(domain.path);
    if (!text) {
        return errno == ENOENT ? std::variant<Domain, std::string>(std::move(domain))
                               : formatted("cannot read {}: {}", domain.path, std::strerror(errno));
    }
    auto content = parseJsonObject(*text);
    if (const auto* wrong = std::get_if<std::string>(&content)) {
        return formatted("{} is {}; correct it by hand first", domain.path, *wrong);
    }
    domain.content = std::get<Dictionary>(std::move(content));
    return domain;
}

ExitStatus store(const Domain& domain) {
    if (const auto failed = createDirectories(domain.directory)) {
        return complain(ExitStatus::failed, *failed);
    }
    // In a file that is not named like a domain's.
    const std::string temporary = formatted("{}.{}", domain.path, ::getpid());
    if (const auto failed = replaceFile(domain.path, temporary, jsonText(domain.content) + "\n")) {
        return complain(ExitStatus::failed, *failed);
    }
    return ExitStatus::done;
}

ExitStatus get(const Domain& domain, std::span<const std::string_view> rest) {
    if (rest.empty()) {
        printLine(jsonText(domain.content));
        return ExitStatus::done;
    }
    const Value* value = domain.content.find(rest[0]);
    if (value == nullptr) {
        return complain(ExitStatus::failed, formatted("{} has no key \"{}\"", domain.path, rest[0]));
    }
    printLine(jsonText(*value));
    return ExitStatus::done;
}

ExitStatus set(Domain& domain, std::span<const std::string_view> rest) {
    auto value = readJson(rest[1]);
    const Value* const json = std::get_if<Value>(&value);
    domain.content.set(rest[0], json != nullptr ? *json : Value(rest[1]));
    return store(domain);
}

ExitStatus unset(Domain& domain, std::span<const std::string_view> rest) {
    if (!domain.content.remove(rest[0])) {
        return complain(ExitStatus::failed, formatted("{} has no key \"{}\"", domain.path, rest[0]));
    }
    return store(domain);
}

ExitStatus run(const Arguments& arguments) {
    const std::span<const std::string_view> words = arguments.rest();
    const std::string_view act = words.empty() ? "" : words[0];
    const bool isGet = act == "get" && (words.size() == 2 || words.size() == 3);
    const bool isSet = act == "set" && words.size() == 4;
    const bool isUnset = act == "unset" && words.size() == 3;
    if (!isGet && !isSet && !isUnset) {
        return complain(ExitStatus::usage, "preference needs: get DOMAIN [KEY], set DOMAIN KEY VALUE, or "
                                           "unset DOMAIN KEY");
    }
    auto loaded = load(std::string(words[1]));
    if (const auto* wrong = std::get_if<std::string>(&loaded)) {
        return complain(ExitStatus::failed, *wrong);
    }
    Domain& domain = std::get<Domain>(loaded);
    const auto rest = words.subspan(2);
    if (isGet) {
        return get(domain, rest);
    }
    return isSet ? set(domain, rest) : unset(domain, rest);
}

} // namespace

constexpr Command kCommandPreference{
    "preference",
    "read or change the service's preferences",
    "get DOMAIN [KEY] | set DOMAIN KEY VALUE | unset DOMAIN KEY",
    "A VALUE that is JSON is taken as such (true, 5, [\"a\",\"b\"]); any other is a text. What is printed is "
    "JSON.\n"
    "A file that is not a JSON object is not touched.",
    {},
    run,
};

} // namespace tamblo::tools
