#include "base/Format.h"
#include "base/NumberText.h"
#include "os/ReplaceFile.h"
#include "os/SmallFile.h"
#include "tools/Command.h"
#include "tools/records/AccessFault.h"
#include "wire/Directories.h"

#include <cerrno>
#include <string>

namespace tamblo::tools {

namespace {

constexpr std::size_t kLongestState = 4096;

/// What the notification's file holds, 0 without one.
std::uint64_t currentState(const std::string& path) {
    return parseDecimalOrHex<std::uint64_t>(SmallFile::read(path, kLongestState).trimmed()).value_or(0);
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
    const auto directories = wire::Directories::ofThisProcess();
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
    const int failure = replaceFileAtomically(path, formatted("{}\n", *state));
    if (failure == ENOENT || failure == ENOTDIR) {
        return complain(
            ExitStatus::unreachable,
            formatted("there is no {}, which the service makes: start tamblod, or set RUNTIME_DIRECTORY",
                      directories.notifications()));
    }
    return failure == 0 ? ExitStatus::done
                        : complain(ExitStatus::failed,
                                   formatted("cannot write {}: {}", path, describeFault(failure, path)));
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
