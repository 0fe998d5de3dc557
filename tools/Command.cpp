#include "tools/Command.h"

#include "base/Format.h"

#include <algorithm>
#include <cstdio>

namespace tamblo::tools {

std::variant<Arguments, std::string> Arguments::parse(std::span<const Option> options,
                                                      std::span<const std::string_view> words) {
    Arguments arguments;
    for (std::size_t i = 0; i < words.size(); ++i) {
        const std::string_view word = words[i];
        if (word == "--") {
            arguments.rest_.insert(arguments.rest_.end(), words.begin() + static_cast<std::ptrdiff_t>(i) + 1,
                                   words.end());
            break;
        }
        if (!word.starts_with("--")) {
            arguments.rest_.push_back(word);
            continue;
        }
        const std::size_t equals = word.find('=');
        const std::string_view name = word.substr(0, equals);
        const auto option = std::find_if(options.begin(), options.end(),
                                         [name](const Option& known) { return known.name == name; });
        if (option == options.end()) {
            return formatted("unknown option \"{}\"", name);
        }
        std::string_view value;
        if (equals != std::string_view::npos) {
            if (option->value.empty()) {
                return formatted("option \"{}\" takes no value", name);
            }
            value = word.substr(equals + 1);
        } else if (!option->value.empty()) {
            if (++i == words.size()) {
                return formatted("option \"{}\" needs a value: {}", name, option->value);
            }
            value = words[i];
        }
        arguments.options_.emplace_back(option->name, value);
    }
    return arguments;
}

std::optional<std::string_view> Arguments::last(std::string_view option) const {
    const auto values = all(option);
    return values.empty() ? std::nullopt : std::optional(values.back());
}

std::vector<std::string_view> Arguments::all(std::string_view option) const {
    std::vector<std::string_view> values;
    for (const auto& [name, value] : options_) {
        if (name == option) {
            values.push_back(value);
        }
    }
    return values;
}

ExitStatus complain(ExitStatus status, std::string_view text) {
    std::fprintf(stderr, "tambloctl: %.*s\n", static_cast<int>(text.size()), text.data());
    return status;
}

void printLine(std::string_view text) {
    std::fwrite(text.data(), 1, text.size(), stdout);
    std::fputc('\n', stdout);
}

} // namespace tamblo::tools
