#include "tools/Command.h"

#include "base/Format.h"
#include "base/SplitText.h"

#include <algorithm>
#include <cstdio>
#include <utility>

namespace tamblo::tools {

namespace {

template <typename Matches>
const Option* findOption(std::span<const Option> options, const Matches& matches) {
    for (const Option* const common : {&kHelpOption, &kVersionOption}) {
        if (matches(*common)) {
            return common;
        }
    }
    const auto found = std::find_if(options.begin(), options.end(), matches);
    return found == options.end() ? nullptr : &*found;
}

bool isOptionWord(std::string_view word) noexcept {
    const bool isNumber = word.size() > 1 && word[1] >= '0' && word[1] <= '9';
    return word.size() > 1 && word[0] == '-' && !isNumber;
}

/// The value that the next word is, which is then taken; or nothing.
std::optional<std::string_view> takeNext(std::span<const std::string_view>& words) {
    if (words.size() < 2) {
        return std::nullopt;
    }
    words = words.subspan(1);
    return words.front();
}

} // namespace

std::variant<Arguments, std::string> Arguments::parse(std::span<const Option> options, Words words) {
    Arguments arguments;
    for (; !words.empty(); words = words.subspan(1)) {
        const std::string_view word = words.front();
        if (word == "--") {
            arguments.rest_.insert(arguments.rest_.end(), words.begin() + 1, words.end());
            break;
        }
        if (!isOptionWord(word)) {
            arguments.rest_.push_back(word);
            continue;
        }
        auto wrong = word.starts_with("--") ? arguments.takeName(options, words)
                                            : arguments.takeLetters(options, words);
        if (wrong) {
            return *std::move(wrong);
        }
    }
    if (auto wrong = arguments.check()) {
        return *std::move(wrong);
    }
    return arguments;
}

std::optional<std::string> Arguments::takeName(std::span<const Option> options, Words& words) {
    const std::string_view word = words.front();
    const std::size_t equals = word.find('=');
    const std::string_view name = word.substr(0, equals);
    const Option* const option =
        findOption(options, [name](const Option& known) { return known.name == name; });
    if (option == nullptr) {
        return formatted("unknown option \"{}\"", name);
    }
    std::optional<std::string_view> value;
    if (equals != std::string_view::npos) {
        if (option->value.empty()) {
            return formatted("option \"{}\" takes no value", name);
        }
        value = word.substr(equals + 1);
    } else if (!option->value.empty()) {
        value = takeNext(words);
        if (!value) {
            return formatted("option \"{}\" needs a value: {}", name, option->value);
        }
    }
    options_.emplace_back(option, value.value_or(std::string_view()));
    return std::nullopt;
}

std::optional<std::string> Arguments::takeLetters(std::span<const Option> options, Words& words) {
    std::string_view letters = words.front().substr(1);
    while (!letters.empty()) {
        const char letter = letters.front();
        letters.remove_prefix(1);
        const Option* const option =
            findOption(options, [letter](const Option& known) { return known.letter == letter; });
        if (option == nullptr) {
            return formatted("unknown option \"-{}\"", std::string_view(&letter, 1));
        }
        std::optional<std::string_view> value;
        if (!option->value.empty()) {
            value = letters.empty() ? takeNext(words) : std::exchange(letters, {});
            if (!value) {
                return formatted("option \"-{}\" needs a value: {}", std::string_view(&letter, 1),
                                 option->value);
            }
        }
        options_.emplace_back(option, value.value_or(std::string_view()));
    }
    return std::nullopt;
}

std::optional<std::string> Arguments::check() const {
    for (std::size_t i = 0; i < options_.size(); ++i) {
        const Option& option = *options_[i].first;
        const auto isSame = [&option](const auto& other) { return other.first == &option; };
        if (!option.isRepeatable && std::count_if(options_.begin(), options_.end(), isSame) > 1 &&
            !option.value.empty()) {
            return formatted("option \"{}\" is given more than once", option.name);
        }
        for (std::string_view excluded = option.excludes; !excluded.empty();) {
            const std::string_view name = takeUpTo(' ', excluded);
            if (has(name)) {
                return formatted("options \"{}\" and \"{}\" cannot go together", option.name, name);
            }
        }
    }
    return std::nullopt;
}

std::optional<std::string_view> Arguments::last(std::string_view option) const {
    const auto values = all(option);
    return values.empty() ? std::nullopt : std::optional(values.back());
}

std::vector<std::string_view> Arguments::all(std::string_view option) const {
    std::vector<std::string_view> values;
    for (const auto& [known, value] : options_) {
        if (known->name == option) {
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
