#include "base/Format.h"
#include "base/NumberText.h"
#include "client/Directories.h"
#include "tools/Command.h"
#include "tools/Files.h"

#include <string>

#include <unistd.h>

namespace tamblo::tools {

namespace {

/// What the notification's file holds, 0 without one.
std::uint64_t currentState(const std::string& path) {
    std::string text = readFile(path).value_or("");
    text.resize(text.find_last_not_of(" \t\r\n") + 1);
    return parseDecimalOrHex<std::uint64_t>(text).value_or(0);
}

ExitStatus run(const Arguments& arguments) {
    const auto& words = arguments.rest();
    if (words.empty() || words.size() > 2) {
        return complain(ExitStatus::usage, "notify needs a NAME, and takes a STATE");
    }
    const std::string name(words[0]);
    if (name.empty() || name.find('/') != std::string::npos || name.starts_with('.')) {
        return complain(ExitStatus::usage, formatted("\"{}\" is no notification name", name));
    }
    const client::Directories directories = client::Directories::ofThisProcess();
    if (directories.runtime.empty()) {
        return complain(ExitStatus::usage,
                        "the runtime directory is not known: set RUNTIME_DIRECTORY or XDG_RUNTIME_DIR");
    }
    const std::string path = directories.notifications() + "/" + name;
    const auto state = words.size() == 2 ? parseDecimalOrHex<std::uint64_t>(words[1]) : currentState(path);
    if (!state) {
        return complain(ExitStatus::usage,
                        formatted("\"{}\" is no state: it is an unsigned 64-bit number", words[1]));
    }
    if (const auto failed = createDirectories(directories.notifications())) {
        return complain(ExitStatus::failed, *failed);
    }
    // Outside the directory of notifications, where it would count as one.
    const std::string temporary = formatted("{}/.notification.{}", directories.runtime, ::getpid());
    if (const auto failed = replaceFile(path, temporary, formatted("{}\n", *state))) {
        return complain(ExitStatus::failed, *failed);
    }
    return ExitStatus::done;
}

} // namespace

constexpr Command kCommandNotify{
    "notify",
    "post a system-wide notification",
    "NAME [STATE]",
    "STATE is the notification's 64-bit state word, decimal or with 0x. Without one the word stays as it is, "
    "0 when\n"
    "there is none, and the notification is posted all the same.",
    {},
    run,
};

} // namespace tamblo::tools
