#include "tools/Completion.h"

#include "base/Format.h"
#include "client/Vocabulary.h"
#include "tools/Command.h"
#include "tools/KnownSettings.h"
#include "tools/records/SinkFile.h"
#include "wire/Vocabulary.h"

#include <algorithm>
#include <array>
#include <cctype>
#include <map>
#include <string_view>

namespace tamblo::tools {

namespace {

/// What may stand for an option's value: words, or files.
struct Values {
    std::string words{};
    bool areFiles = false;
    bool areFirst = false; ///< the words stand right behind the command only
};

void add(std::string& words, std::string_view word) {
    words.append(words.empty() ? "" : " ").append(word);
}

std::string categoryWords() {
    std::string words;
    for (const std::string_view kind : wire::kKindNames) {
        add(words, kind);
    }
    for (const auto& [subsystem, name] : wire::kSubsystemNames) {
        for (const std::string_view kind : wire::kKindNames) {
            add(words, formatted("{}_{}", name, kind));
        }
    }
    return words;
}

template <std::size_t kSize> std::string wordsOf(const std::array<std::string_view, kSize>& names) {
    std::string words;
    for (const std::string_view name : names) {
        add(words, name);
    }
    return words;
}

/// By the option's name, and by what its help puts in its value's place.
Values valuesOf(const Option& option) {
    if (option.name == "--service-type") {
        return {.words = wordsOf(wire::kServiceNames)};
    }
    if (option.value == "CATEGORY") {
        return {.words = categoryWords()};
    }
    if (option.value == "TYPE") {
        return {.words = wordsOf(wire::kTypeNames)};
    }
    if (option.value.find('|') != option.value.npos) {
        std::string words(option.value);
        std::replace(words.begin(), words.end(), '|', ' ');
        return {.words = std::move(words)};
    }
    return {.areFiles = option.value == "FILE" || option.value == "PATH"};
}

/// What a command's usage line names first besides its options: words in lower case stand for themselves.
Values argumentsOf(const Command& command) {
    Values values;
    if (command.name == "notify") {
        for (const KnownNotification& notification : knownNotifications()) {
            add(values.words, notification.name);
        }
        return values;
    }
    if (command.name == "tail" || command.name == "export") {
        for (const KnownSink& sink : knownSinks()) {
            add(values.words, sink.name);
        }
        values.areFiles = true;
        return values;
    }
    values.areFirst = true;
    std::string_view rest = command.arguments;
    while (!rest.empty()) {
        const std::size_t end = rest.find_first_of(" |[]()");
        const std::string_view word = rest.substr(0, end);
        if (!word.empty() && word.find_first_not_of("abcdefghijklmnopqrstuvwxyz-") == word.npos &&
            word[0] != '-') {
            add(values.words, word);
        }
        values.areFiles = values.areFiles || word == "DIRECTORY";
        rest.remove_prefix(end == rest.npos ? rest.size() : end + 1);
    }
    return values;
}

/// The preferences that the service reads: keys by domain.
std::map<std::string_view, std::string> preferenceKeys() {
    std::map<std::string_view, std::string> keys;
    for (const KnownPreference& known : knownPreferences()) {
        add(keys[known.domain], known.key);
    }
    return keys;
}

std::string preferenceDomains() {
    std::string domains;
    for (const auto& [domain, keys] : preferenceKeys()) {
        add(domains, domain);
    }
    return domains;
}

std::string commandNames() {
    std::string words;
    for (const Command* const command : allCommands()) {
        add(words, command->name);
    }
    return words;
}

/// Calls with every option of the command, those of all commands behind its own.
template <typename Act> void forEachOption(const Command& command, const Act& act) {
    for (const Option& option : command.options) {
        act(option);
    }
    act(kHelpOption);
    act(kVersionOption);
}

std::string lettersAndName(const Option& option, std::string_view between) {
    std::string text;
    if (option.letter != 0) {
        text.append("-").append(1, option.letter).append(between);
    }
    return text.append(option.name);
}

/// In single quotes for a shell, and, for zsh, without what its descriptions give a meaning.
std::string described(std::string_view text) {
    std::string result;
    for (const char character : text) {
        if (character == '\'') {
            result.append("'\\''");
        } else {
            result.append(character == '[' || character == ']' || character == ':' ? "\\" : "")
                .push_back(character);
        }
    }
    return result;
}

void appendBashCommand(std::string& script, const Command& command) {
    script.append(formatted("        {})\n", command.name));
    std::string options;
    std::string values;
    forEachOption(command, [&](const Option& option) {
        add(options, lettersAndName(option, " "));
        if (option.value.empty()) {
            return;
        }
        const Values own = valuesOf(option);
        values.append(formatted("                {}) words='{}' files={} ;;\n", lettersAndName(option, " | "),
                                own.words, own.areFiles ? "yes" : ""));
    });
    const Values arguments = argumentsOf(command);
    script.append(formatted("            {}words='{}'\n            files={}\n",
                            arguments.areFirst ? "((COMP_CWORD != 2)) || " : "", arguments.words,
                            arguments.areFiles ? "yes" : ""));
    if (command.name == "preference") {
        script.append(formatted("            ((COMP_CWORD != 3)) || words='{}'\n", preferenceDomains()));
        script.append("            ((COMP_CWORD != 4)) || case $previous in\n");
        for (const auto& [domain, keys] : preferenceKeys()) {
            script.append(formatted("                {}) words='{}' ;;\n", domain, keys));
        }
        script.append("            esac\n");
    }
    script.append(formatted("            [[ $word != -* ]] || words='{}' files=\n", options));
    if (!values.empty()) {
        script.append("            case $previous in\n").append(values).append("            esac\n");
    }
    script.append("            ;;\n");
}

void appendZshCommand(std::string& script, const Command& command) {
    script.append(formatted("        {})\n            _arguments", command.name));
    forEachOption(command, [&](const Option& option) {
        std::string row = " \\\n                ";
        const std::string_view repeats = option.isRepeatable ? "*" : "";
        const std::string help = described(option.help);
        std::string value;
        if (!option.value.empty()) {
            const Values own = valuesOf(option);
            const std::string from = own.areFiles        ? "_files"
                                     : own.words.empty() ? ""
                                                         : formatted("({})", own.words);
            value = formatted(":{}:{}", described(option.value), from.empty() ? " " : from);
        }
        if (option.letter != 0) {
            row.append(
                formatted("'{}-{}[{}]{}' ", repeats, std::string_view(&option.letter, 1), help, value));
        }
        // With the sign the value may stand behind one, or be the next word.
        script.append(row).append(
            formatted("'{}{}{}[{}]{}'", repeats, option.name, value.empty() ? "" : "=", help, value));
    });
    const Values arguments = argumentsOf(command);
    if (arguments.areFiles) {
        script.append(formatted(
            " \\\n                '1:file:{_alternative \"names:name:({})\" \"files:file:_files\"}'",
            arguments.words));
    } else if (!arguments.words.empty()) {
        script.append(formatted(" \\\n                '1:word:({})'", arguments.words));
    }
    if (command.name == "preference") {
        script.append(
            formatted(" \\\n                '2:domain:({})' '3:key:{case $words[3] in", preferenceDomains()));
        for (const auto& [domain, keys] : preferenceKeys()) {
            script.append(formatted(" ({}) compadd {} ;;", domain, keys));
        }
        script.append(" esac}'");
    }
    script.append("\n            ;;\n");
}

} // namespace

std::string bashCompletion() {
    std::string script =
        formatted("# What completes command lines of tambloctl in bash.\n"
                  "_tambloctl() {\n"
                  "    local word=${COMP_WORDS[COMP_CWORD]} previous=${COMP_WORDS[COMP_CWORD - 1]}\n"
                  "    local words='' files='' commands='{}'\n"
                  "    # Of --option=value bash makes three words.\n"
                  "    if [[ $word == = ]]; then\n"
                  "        word=\n"
                  "    elif [[ $previous == = ]]; then\n"
                  "        previous=${COMP_WORDS[COMP_CWORD - 2]}\n"
                  "    fi\n"
                  "    if ((COMP_CWORD == 1)); then\n"
                  "        words=\"$commands help --help --version\"\n"
                  "    fi\n"
                  "    case ${COMP_WORDS[1]} in\n"
                  "        help) ((COMP_CWORD != 2)) || words=$commands ;;\n",
                  commandNames());
    for (const Command* const command : allCommands()) {
        appendBashCommand(script, *command);
    }
    return script.append(
        "    esac\n"
        "    mapfile -t COMPREPLY < <(compgen -W \"$words\" -- \"$word\")\n"
        "    [[ -z $files ]] || mapfile -t -O \"${#COMPREPLY[@]}\" COMPREPLY < <(compgen -f -- "
        "\"$word\")\n"
        "}\n"
        "complete -o filenames -F _tambloctl tambloctl\n");
}

std::string zshCompletion() {
    std::string script = "#compdef tambloctl\n# What completes command lines of tambloctl in zsh.\n"
                         "_tambloctl() {\n"
                         "    if ((CURRENT == 2)); then\n"
                         "        local -a commands=(\n";
    for (const Command* const command : allCommands()) {
        script.append(formatted("            '{}:{}'\n", command->name, described(command->summary)));
    }
    script.append("            'help:say more about a command'\n"
                  "        )\n"
                  "        _describe command commands\n"
                  "        return\n"
                  "    fi\n"
                  "    local command=${words[2]}\n"
                  "    shift words\n"
                  "    ((CURRENT--))\n"
                  "    case $command in\n");
    script.append(formatted("        help) _arguments '1:command:({})' ;;\n", commandNames()));
    for (const Command* const command : allCommands()) {
        appendZshCommand(script, *command);
    }
    return script.append("    esac\n"
                         "}\n"
                         "_tambloctl \"$@\"\n");
}

} // namespace tamblo::tools
