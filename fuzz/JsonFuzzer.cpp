#include "base/JsonReader.h"

#include <cstddef>
#include <cstdint>
#include <cstdlib>
#include <string>
#include <string_view>
#include <variant>

namespace tamblo {
namespace {

void require(bool holds) {
    if (!holds) {
        std::abort();
    }
}

/// What was read and is written again reads back as the same value and is written as the same text; what is
/// refused is refused at a place in the text. An array is read by its elements exactly when it is as a value.
void checkJson(std::string_view text) {
    const auto first = readJson(text);
    const auto strict = readJson(text, {.refuseNull = true});
    JsonReader elements(text);
    while (elements.readElement() != nullptr) {
    }
    const auto* read = std::get_if<Value>(&first);
    require(elements.error().has_value() == (read == nullptr || !read->isArray()));
    if (const auto* error = std::get_if<JsonError>(&first)) {
        require(std::holds_alternative<JsonError>(strict));
        require(error->line >= 1 && error->column >= 1 && !error->message.empty());
        require(error->line + error->column <= text.size() + 2);
        return;
    }
    const Value& value = std::get<Value>(first);
    require(!std::holds_alternative<Value>(strict) || std::get<Value>(strict) == value);

    const std::string written = jsonText(value);
    const auto second = readJson(written, {.refuseNull = true});
    require(std::holds_alternative<Value>(second));
    require(std::get<Value>(second) == value);
    require(jsonText(std::get<Value>(second)) == written);
}

} // namespace
} // namespace tamblo

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* bytes, std::size_t size) {
    tamblo::checkJson({reinterpret_cast<const char*>(bytes), size});
    return 0;
}
