#include "tools/SessionFile.h"

#include "base/Format.h"
#include "base/Json.h"
#include "tools/Payload.h"

#include <algorithm>

namespace tamblo::tools {

namespace {

/// A name or a number as text, so that both are read alike.
std::string wordOf(const Value* value, std::string_view usual) {
    if (value == nullptr) {
        return std::string(usual);
    }
    return value->isString() ? std::string(value->stringValue()) : jsonText(*value);
}

} // namespace

std::variant<SessionLine, std::string> parseSessionLine(std::string_view text) {
    auto object = parseJsonObject(text, kForService);
    if (auto* wrong = std::get_if<std::string>(&object)) {
        return std::move(*wrong);
    }
    const auto& fields = std::get<Dictionary>(object);
    SessionLine line;
    const auto category = client::parseCategory(wordOf(fields.find("category"), ""));
    if (!category) {
        return std::string("\"category\" is missing, or neither a category's name nor a number");
    }
    line.category = *category;
    const auto type = client::parseType(wordOf(fields.find("type"), "Generic"));
    if (!type) {
        return std::string("\"type\" is neither a type's name nor a number");
    }
    line.type = *type;
    if (const Value* offset = fields.find("offset_s")) {
        if (!offset->isNumber() || offset->doubleValue() < 0) {
            return std::string("\"offset_s\" is not a number of seconds");
        }
        line.offset = offset->doubleValue();
    }
    if (const Value* payload = fields.find("payload")) {
        if (!payload->isDictionary()) {
            return std::string("\"payload\" is not an object");
        }
        line.payload = payload->dictionaryValue();
    }
    return line;
}

double SessionSpacing::due(const SessionLine& line) {
    const Value* const timestamp = line.payload.find(kTimestampKey);
    if (timestamp != nullptr && !timestampOfStart_) {
        timestampOfStart_ = timestamp->doubleValue() - line.offset.value_or(last_);
    }
    if (line.offset) {
        last_ = *line.offset;
    } else if (timestamp != nullptr) {
        last_ = std::max(last_, timestamp->doubleValue() - *timestampOfStart_);
    }
    return last_;
}

} // namespace tamblo::tools
