#include "wire/ConnectedAccessories.h"

#include "base/Dictionary.h"
#include "base/Json.h"
#include "base/TextBuffer.h"

#include <variant>

namespace tamblo::wire {

namespace {

constexpr std::string_view kIdentifier = "identifier";
constexpr std::string_view kModel = "model";
constexpr std::string_view kFormFactor = "form_factor";

std::string textOf(const Dictionary& fields, std::string_view key) {
    const Value* const value = fields.find(key);
    return value == nullptr ? std::string() : std::string(value->stringValue());
}

} // namespace

std::string connectedAccessoriesText(const std::vector<ConnectedAccessory>& accessories) {
    Array array;
    for (const ConnectedAccessory& accessory : accessories) {
        array.emplace_back(Dictionary{{kIdentifier, accessory.identifier},
                                      {kModel, accessory.model},
                                      {kFormFactor, accessory.formFactor}});
    }
    TextBuffer text;
    appendJson(text, Value(std::move(array)));
    return std::string(text.view()) + "\n";
}

std::optional<std::vector<ConnectedAccessory>> parseConnectedAccessories(std::string_view text) {
    const auto parsed = readJson(text);
    const auto* const value = std::get_if<Value>(&parsed);
    if (value == nullptr || !value->isArray()) {
        return std::nullopt;
    }
    std::vector<ConnectedAccessory> accessories;
    for (const Value& entry : value->arrayValue()) {
        const Dictionary& fields = entry.dictionaryValue();
        std::string identifier = textOf(fields, kIdentifier);
        if (!identifier.empty() && accessories.size() < kMostConnectedAccessories) {
            accessories.push_back(
                {std::move(identifier), textOf(fields, kModel), textOf(fields, kFormFactor)});
        }
    }
    return accessories;
}

} // namespace tamblo::wire
