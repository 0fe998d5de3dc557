#pragma once

#include <optional>
#include <span>
#include <string>
#include <string_view>
#include <utility>
#include <variant>
#include <vector>

namespace tamblo::tools {

/// An option that a command takes.
struct Option {
    std::string_view name;  ///< with its dashes
    std::string_view value; ///< what stands for its value in the help; empty: it takes none
    std::string_view help;
    char letter = 0;           ///< its short form, behind one dash; 0: it has none
    bool isRepeatable = false; ///< may be given several times
    /// The names of options that cannot be given with this one, with spaces between them.
    std::string_view excludes{};
};

/// The options of every command.
inline constexpr Option kHelpOption{.name = "--help", .value = "", .help = "this text", .letter = 'h'};
inline constexpr Option kVersionOption{
    .name = "--version", .value = "", .help = "the version of tambloctl", .letter = 'V'};

/// A command line, taken apart: options as `--name value`, `--name=value`, `-n value` or `-nvalue`, letters
/// without values also together (`-fj`), and the rest in order. Everything behind `--` belongs to the rest,
/// and so do a single dash and what begins with a dash and a digit, a negative number.
class Arguments {
public:
    /// The options are those of the table, `kHelpOption` and `kVersionOption`. Or a line that says what is
    /// wrong.
    [[nodiscard]] static std::variant<Arguments, std::string> parse(std::span<const Option> options,
                                                                    std::span<const std::string_view> words);

    [[nodiscard]] bool has(std::string_view option) const { return last(option).has_value(); }
    /// The value given last.
    [[nodiscard]] std::optional<std::string_view> last(std::string_view option) const;
    [[nodiscard]] std::vector<std::string_view> all(std::string_view option) const;
    [[nodiscard]] const std::vector<std::string_view>& rest() const noexcept { return rest_; }

private:
    using Words = std::span<const std::string_view>;

    /// Takes the options of the words' first, and the next word where it is an option's value.
    [[nodiscard]] std::optional<std::string> takeName(std::span<const Option> options, Words& words);
    [[nodiscard]] std::optional<std::string> takeLetters(std::span<const Option> options, Words& words);
    /// Whether the options that were given may stand together.
    [[nodiscard]] std::optional<std::string> check() const;

    std::vector<std::pair<const Option*, std::string_view>> options_;
    std::vector<std::string_view> rest_;
};

/// What every command exits with.
enum class ExitStatus : int {
    done = 0,
    failed = 1,      ///< the service refused or failed, or what was asked for does not exist
    usage = 2,       ///< the command line, or the input, is wrong
    unreachable = 3, ///< no service answers
};

/// One of tambloctl's commands: a row of its table.
struct Command {
    std::string_view name;
    std::string_view summary;        ///< one line
    std::string_view arguments;      ///< behind the name in the usage line
    std::string_view details;        ///< for its help
    std::span<const Option> options; ///< but for those of every command
    ExitStatus (*run)(const Arguments& arguments);
};

extern const Command kCommandSend;
extern const Command kCommandSession;
extern const Command kCommandRecord;
extern const Command kCommandReporters;
extern const Command kCommandValidate;
extern const Command kCommandTail;
extern const Command kCommandList;
extern const Command kCommandTap;
extern const Command kCommandNotify;
extern const Command kCommandPreference;
extern const Command kCommandDecode;
extern const Command kCommandReport;
extern const Command kCommandExport;
extern const Command kCommandKill;
extern const Command kCommandStatus;
extern const Command kCommandClients;
extern const Command kCommandSessions;
extern const Command kCommandTop;

/// `session show ID`.
ExitStatus showSession(const Arguments& arguments);

/// All of them, in the order in which the help lists them.
[[nodiscard]] std::span<const Command* const> allCommands() noexcept;
/// What `tambloctl --help` prints, and `tambloctl COMMAND --help`.
[[nodiscard]] std::string helpForAll();
[[nodiscard]] std::string helpFor(const Command& command);

/// Writes `tambloctl: TEXT` to standard error and answers the status, so that a command can return it.
ExitStatus complain(ExitStatus status, std::string_view text);
/// Writes a line to standard output.
void printLine(std::string_view text);

} // namespace tamblo::tools
