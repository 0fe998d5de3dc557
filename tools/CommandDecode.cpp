#include "base/Format.h"
#include "os/FileDescriptor.h"
#include "os/SmallFile.h"
#include "tools/Command.h"
#include "tools/Decode.h"
#include "tools/records/AccessFault.h"

#include <cerrno>
#include <cstdio>
#include <utility>

#include <fcntl.h>

namespace tamblo::tools {

namespace {

/// Bytes: far above what a service writes in a year.
constexpr std::size_t kLargestInput = 1U << 30U;

constexpr Option kOptions[] = {
    {.name = "--kind",
     .value = "record|line|frame",
     .help = "what is decoded; guessed without it",
     .letter = 'k'},
    {.name = "--file", .value = "FILE", .help = "decode what the file holds", .letter = 'f'},
};

ExitStatus run(const Arguments& arguments) {
    const auto file = arguments.last("--file");
    if (arguments.rest().size() + (file ? 1 : 0) > 1) {
        return complain(ExitStatus::usage, "decode takes one text or one file");
    }
    std::optional<EncodedKind> kind;
    if (const auto name = arguments.last("--kind")) {
        kind = encodedKindNamed(*name);
        if (!kind) {
            return complain(ExitStatus::usage,
                            formatted("\"{}\" is no kind: they are record, line and frame", *name));
        }
    }
    std::optional<std::string> input;
    if (!arguments.rest().empty()) {
        input = arguments.rest()[0];
    } else {
        const std::string path(file.value_or("/dev/stdin"));
        // Of any kind: a pipe or a terminal, too.
        const FileDescriptor opened(::open(path.c_str(), O_RDONLY | O_CLOEXEC));
        SmallFile content = opened.isOpen() ? SmallFile::read(opened.get(), kLargestInput) : SmallFile{errno};
        if (content.error != 0) {
            return complain(ExitStatus::usage, formatted("cannot read {}: {}", path,
                                                         content.error == EACCES ? describeFault(EACCES, path)
                                                                                 : content.reason()));
        }
        input = std::move(content.text);
    }
    const EncodedKind used = kind ? *kind : guessEncodedKind(*input);
    const Decoded decoded = decode(*input, used);
    std::fwrite(decoded.text.data(), 1, decoded.text.size(), stdout);
    std::fflush(stdout);
    for (const std::string& problem : decoded.problems) {
        (void)complain(ExitStatus::usage, problem);
    }
    if (decoded.problems.empty()) {
        return ExitStatus::done;
    }
    return kind || !decoded.text.empty()
               ? ExitStatus::usage
               : complain(ExitStatus::usage,
                          formatted("it was taken for a {}; --kind names another kind", nameOf(used)));
}

} // namespace

constexpr Command kCommandDecode{
    "decode",
    "show what a metric record, a line of a report or a frame of the protocol says",
    "[TEXT | --file FILE] [--kind KIND]",
    "Decodes the text, the file, or else standard input:\n"
    "  record  metric records in Base64, one a line\n"
    "  line    lines of a report sink; a metric's record is decoded, too\n"
    "  frame   frames of the client protocol as they travel, or as hexadecimal digits\n"
    "What cannot be decoded is told of on standard error, and the exit status is then 2.",
    kOptions,
    run,
};

} // namespace tamblo::tools
