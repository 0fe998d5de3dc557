#include "tools/SessionFile.h"

#include "base/Format.h"
#include "base/Json.h"
#include "base/TextBuffer.h"
#include "tools/records/Payload.h"

#include <algorithm>
#include <array>
#include <cmath>
#include <utility>

namespace tamblo::tools {

namespace {

constexpr std::string_view kApplicationKey = "HostApplicationDisplayID";
constexpr std::string_view kOtherApplicationKey = "QVHostApplicationDisplayID";
constexpr std::string_view kTagKey = "audiotag";
constexpr std::string_view kInvalidTimestampKey = "invalid_timestamp";
/// In a message about a feature of the device: when it was read.
constexpr std::string_view kLastUpdatedKey = "last_updated";
/// In the message that sums up all others, for the call-quality service.
constexpr std::string_view kSummaryOfAllKey = "ZR_Session_Summary_Event";

constexpr std::uint32_t numberOf(client::EventKind kind) noexcept {
    return static_cast<std::uint32_t>(kind);
}
constexpr std::uint16_t numberOf(client::EventType type) noexcept {
    return static_cast<std::uint16_t>(type);
}

bool isDerivedKind(std::uint32_t category) noexcept {
    using enum client::EventKind;
    const std::array derived{numberOf(input), numberOf(volume), numberOf(kaleen),
                             numberOf(generic) | static_cast<std::uint32_t>(client::Subsystem::session)};
    return std::ranges::find(derived, category) != derived.end();
}

/// By name where there is one that is read back as the number.
Value categoryWord(std::uint32_t number) {
    const auto category = static_cast<client::EventCategory>(number);
    const std::string name = client::categoryName(category);
    return client::parseCategory(name) == category ? Value(name) : Value(number);
}

Value typeWord(std::uint16_t number) {
    const auto type = static_cast<client::EventType>(number);
    const std::string_view name = client::typeName(type);
    return client::parseType(name) == type ? Value(name) : Value(number);
}

double roundedToMicroseconds(double seconds) noexcept {
    constexpr double kMicroseconds = 1e6;
    return std::round(seconds * kMicroseconds) / kMicroseconds;
}

std::string_view reason(MadeByService made) noexcept {
    switch (made) {
    case MadeByService::summaries:
        return "summaries";
    case MadeByService::driverStatistics:
        return "driver statistics";
    case MadeByService::deviceFeatures:
        break;
    }
    return "features of the device";
}

} // namespace

std::variant<std::optional<SessionHeader>, std::string> parseSessionHeader(std::string_view text) {
    const auto object = parseJsonObject(text, kForService);
    const auto* const line = std::get_if<Dictionary>(&object);
    const Value* const session = line != nullptr ? line->find("session") : nullptr;
    if (session == nullptr || line->contains("category")) {
        return std::optional<SessionHeader>();
    }
    if (!session->isDictionary()) {
        return std::string("\"session\" is not an object");
    }
    SessionHeader header;
    if (const Value* type = session->dictionaryValue().find("service_type")) {
        header.serviceType = client::parseServiceType(plainText(*type));
        if (!header.serviceType) {
            return std::string("\"service_type\" is neither a service type's name nor a number");
        }
    }
    if (const Value* configuration = session->dictionaryValue().find("configuration")) {
        if (!configuration->isDictionary()) {
            return std::string("\"configuration\" is not an object");
        }
        header.configuration = configuration->dictionaryValue();
    }
    return std::optional(std::move(header));
}

std::optional<MadeByService> madeByService(const RecordedMessage& message) {
    const bool isSummary = message.type == numberOf(client::EventType::summary);
    if ((isSummary && isDerivedKind(message.category)) || message.payload.contains(kSummaryOfAllKey)) {
        return MadeByService::summaries;
    }
    if (message.category == numberOf(client::EventKind::chanlog)) {
        return MadeByService::driverStatistics;
    }
    if (message.category == numberOf(client::EventKind::setup) &&
        message.type == numberOf(client::EventType::setup) && message.payload.contains(kLastUpdatedKey)) {
        return MadeByService::deviceFeatures;
    }
    return std::nullopt;
}

std::uint32_t categoryOfKind(std::uint16_t kind, std::uint16_t type, const Dictionary& payload) {
    constexpr auto kUnknown = static_cast<std::uint32_t>(client::EventCategory::unknown);
    if (kind == static_cast<std::uint16_t>(kUnknown)) {
        return kUnknown;
    }
    const Value* const tag = payload.find(kTagKey);
    const std::string_view kindName = wire::kKindNames[kind < wire::kKindNames.size() ? kind : 0];
    const std::string_view typeName = client::typeName(static_cast<client::EventType>(type));
    for (const auto& [subsystem, name] : wire::kSubsystemNames) {
        if (tag != nullptr && tag->stringValue() == formatted("{}_{}{}", name, kindName,
                                                              typeName.empty() ? "Generic" : typeName)) {
            return static_cast<std::uint32_t>(subsystem) | kind;
        }
    }
    return kind;
}

void SessionFileWriter::writeHeader(std::string_view serviceType, const Dictionary& configuration,
                                    const Dictionary& about) {
    Dictionary session = about;
    session.set("service_type", serviceType);
    session.set("configuration", configuration);
    writeLine(jsonText(Dictionary{{"session", std::move(session)}}));
    for (const std::string_view key : {kOtherApplicationKey, kApplicationKey}) {
        if (const Value* name = configuration.find(key)) {
            application_ = *name;
        }
    }
}

void SessionFileWriter::take(RecordedMessage message) {
    if (const auto made = madeByService(message)) {
        ++leftOut_[*made];
        return;
    }
    if (message.offset < last_) {
        ++setBack_;
    }
    last_ = std::max(last_, message.offset);
    message.payload.remove(kTagKey);
    message.payload.remove(kInvalidTimestampKey);
    const Value* const name = message.payload.find(kApplicationKey);
    if (name != nullptr && *name == application_) {
        message.payload.remove(kApplicationKey);
    }
    TextBuffer line;
    line.append("{\"offset_s\":");
    appendJsonNumber(line, roundedToMicroseconds(last_));
    line.append(",\"category\":");
    appendJson(line, categoryWord(message.category));
    line.append(",\"type\":");
    appendJson(line, typeWord(message.type));
    line.append(",\"payload\":");
    appendJson(line, Value(std::move(message.payload)));
    line.append("}");
    writeLine(line.view());
    ++written_;
}

void SessionFileWriter::writeLine(std::string_view line) {
    (void)std::fwrite(line.data(), 1, line.size(), file_);
    (void)std::fputc('\n', file_);
}

std::string SessionFileWriter::leftOut() const {
    std::string text;
    for (const auto& [made, count] : leftOut_) {
        appendFormatted(text, ", {} left out as playing makes them anew ({})", count, reason(made));
    }
    if (setBack_ != 0) {
        appendFormatted(text, ", {} moved behind the one before, as the clock was set back", setBack_);
    }
    return text;
}

} // namespace tamblo::tools
