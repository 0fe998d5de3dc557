#include "base/JsonPretty.h"

#include "base/Json.h"

#include <cmath>
#include <cstddef>
#include <span>

namespace tamblo {

namespace {

/// A line end and an indentation that most values do not exceed.
constexpr std::string_view kLineStart = "\n                                ";
constexpr std::size_t kIndent = 2;

/// The kind of a value that JSON has no form for, for people; null for any other.
const char* kindWithoutForm(const Value& value) noexcept {
    switch (value.kind()) {
    case Value::Kind::date:
        return "a date";
    case Value::Kind::data:
        return "a byte string";
    case Value::Kind::singleFloat:
    case Value::Kind::doubleFloat:
        return std::isfinite(value.doubleValue()) ? nullptr : "a number that is not finite";
    default:
        return nullptr;
    }
}

/// Writes one document. Every operation answers whether all that it was given has a JSON form; one that
/// fails adds its own step in front of the way to what has none.
class PrettyWriter {
public:
    explicit PrettyWriter(TextBuffer& out) noexcept : out_(out) {}

    bool wrapped(std::string_view key, const Dictionary& dictionary) {
        open('{');
        startLine();
        appendJsonString(out_, key);
        out_.append(": ");
        if (!object(dictionary)) {
            return failedIn(key);
        }
        close('}');
        return true;
    }

    [[nodiscard]] std::string failure() const {
        return std::string(kind_) + " has no JSON form, at " + pointer_;
    }

private:
    bool object(const Dictionary& dictionary) {
        const KeySet& keys = dictionary.keys();
        const std::span<const Value> values = dictionary.values();
        if (values.empty()) {
            out_.append("{}");
            return true;
        }
        open('{');
        for (std::size_t i = 0; i < values.size(); ++i) {
            separate(i);
            out_.append(keys.jsonKey(i));
            out_.append(' ');
            if (!item(values[i])) {
                return failedIn(keys.key(i));
            }
        }
        close('}');
        return true;
    }

    bool array(std::span<const Value> elements) {
        if (elements.empty()) {
            out_.append("[]");
            return true;
        }
        open('[');
        for (std::size_t i = 0; i < elements.size(); ++i) {
            separate(i);
            if (!item(elements[i])) {
                return failedIn(std::to_string(i));
            }
        }
        close(']');
        return true;
    }

    bool item(const Value& value) {
        if (value.isDictionary()) {
            return object(value.dictionaryValue());
        }
        if (value.isArray()) {
            return array(value.arrayValue());
        }
        kind_ = kindWithoutForm(value);
        if (kind_ != nullptr) {
            return false;
        }
        appendJson(out_, value);
        return true;
    }

    void open(char bracket) {
        out_.append(bracket);
        depth_ += kIndent;
    }

    void close(char bracket) {
        depth_ -= kIndent;
        startLine();
        out_.append(bracket);
    }

    void separate(std::size_t index) {
        if (index != 0) {
            out_.append(',');
        }
        startLine();
    }

    void startLine() {
        out_.append(kLineStart.substr(0, depth_ + 1));
        for (std::size_t written = kLineStart.size(); written <= depth_; ++written) {
            out_.append(' ');
        }
    }

    bool failedIn(std::string_view step) {
        std::string escaped = "/";
        for (const char character : step) {
            if (character == '~') {
                escaped += "~0";
            } else if (character == '/') {
                escaped += "~1";
            } else {
                escaped += character;
            }
        }
        pointer_.insert(0, escaped);
        return false;
    }

    TextBuffer& out_;
    std::size_t depth_ = 0;
    const char* kind_ = nullptr; ///< of what has no form
    std::string pointer_;        ///< the way to it
};

} // namespace

std::optional<std::string> appendPrettyJson(TextBuffer& out, std::string_view key,
                                            const Dictionary& dictionary) {
    const std::size_t begin = out.size();
    PrettyWriter writer(out);
    if (writer.wrapped(key, dictionary)) {
        return std::nullopt;
    }
    out.truncate(begin);
    return writer.failure();
}

} // namespace tamblo
