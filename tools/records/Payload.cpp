#include "tools/records/Payload.h"

#include "base/Format.h"

namespace tamblo::tools {

std::variant<Dictionary, std::string> parseJsonObject(std::string_view text, JsonReadOptions options) {
    auto read = readJson(text, options);
    if (const auto* error = std::get_if<JsonError>(&read)) {
        // Who reads lines says which one it is.
        const std::string line =
            text.find('\n') == std::string_view::npos ? std::string() : formatted("line {}, ", error->line);
        return formatted("not usable JSON: {}column {}: {}", line, error->column, error->message);
    }
    const Value& value = std::get<Value>(read);
    if (!value.isDictionary()) {
        return std::string("not a JSON object");
    }
    return value.dictionaryValue();
}

Value parseScalar(std::string_view text) {
    auto read = readJson(text);
    const Value* value = std::get_if<Value>(&read);
    if (value == nullptr || value->isDictionary() || value->isArray()) {
        return Value(text);
    }
    return *value;
}

std::variant<Dictionary, std::string> parsePayload(std::span<const std::string_view> words) {
    if (words.size() == 1 && words[0].starts_with('{')) {
        auto payload = parseJsonObject(words[0], kForService);
        if (const auto* wrong = std::get_if<std::string>(&payload)) {
            return "the payload is " + *wrong;
        }
        return payload;
    }
    Dictionary payload;
    for (const std::string_view word : words) {
        const std::size_t equals = word.find('=');
        if (equals == std::string_view::npos || equals == 0) {
            return formatted("\"{}\" is not KEY=VALUE; a payload is such words, or one JSON object", word);
        }
        const std::string_view key = word.substr(0, equals);
        if (payload.contains(key)) {
            return formatted("the payload has the key \"{}\" twice", key);
        }
        const std::string_view value = word.substr(equals + 1);
        if (value == "null") {
            return formatted("\"{}\": the service takes no null; {}='\"null\"' is the text", word, key);
        }
        payload.set(key, parseScalar(value));
    }
    return payload;
}

std::string plainText(const Value& value) {
    std::string text = jsonText(value);
    return value.isString() ? text.substr(1, text.size() - 2) : text;
}

} // namespace tamblo::tools
