#include "tools/LiveRecorder.h"

#include "base/Format.h"
#include "client/Vocabulary.h"
#include "tools/records/Payload.h"

#include <utility>
#include <variant>

namespace tamblo::tools {

namespace {

const Value& member(const Dictionary& record, std::string_view key) {
    static const Value kNone;
    const Value* const value = record.find(key);
    return value != nullptr ? *value : kNone;
}

} // namespace

bool LiveRecorder::take(std::string_view line) {
    const auto parsed = parseJsonObject(line);
    const auto* const record = std::get_if<Dictionary>(&parsed);
    if (record == nullptr) {
        ++leftOut_;
        return true;
    }
    if (const Value* leftOut = record->find("left_out")) {
        leftOut_ += leftOut->unsignedValue();
        const auto session = hasBegun_ ? session_() : std::nullopt;
        hasStopped_ = hasBegun_ && (!session || member(*session, "state").stringValue() == "stopped");
        return !hasStopped_;
    }
    const auto type = static_cast<client::EventType>(member(*record, "type").unsignedValue());
    const bool isStarted = member(*record, "started").boolValue();
    const bool isOwn = member(*record, "origin").stringValue() == "session";
    if (isOwn && type == client::EventType::start && !isStarted) {
        if (hasBegun_) {
            return false; // another session has taken the place of the first one
        }
        begin(*record, true);
        return true;
    }
    if (!isStarted) {
        return true;
    }
    if (!hasBegun_) {
        begin(*record, false);
    }
    if (isOwn) {
        hasStopped_ = type == client::EventType::stop;
        return !hasStopped_;
    }
    const Value& payload = member(*record, "payload");
    if (!payload.isDictionary()) {
        ++large_;
        return true;
    }
    withoutNull_ += std::holds_alternative<std::string>(parseJsonObject(line, kForService)) ? 1 : 0;
    writer_.take({.offset = member(*record, "time").doubleValue() - start_,
                  .category = static_cast<std::uint32_t>(member(*record, "category").unsignedValue()),
                  .type = static_cast<std::uint16_t>(type),
                  .payload = payload.dictionaryValue()});
    return true;
}

void LiveRecorder::begin(const Dictionary& record, bool isAtStart) {
    hasBegun_ = true;
    hasBeginning_ = isAtStart;
    start_ = member(record, "time").doubleValue();
    serviceType_ = member(record, "service").stringValue();
    const std::optional<Dictionary> session = session_();
    const Value& configuration = session ? member(*session, "configuration") : Value();
    hasConfiguration_ = configuration.isDictionary();
    writer_.writeHeader(serviceType_, hasConfiguration_ ? configuration.dictionaryValue() : Dictionary(),
                        {{"reporter", reporterID_}, {"time", start_}});
}

std::string LiveRecorder::missing() const {
    std::string text;
    if (!hasBeginning_) {
        text += "it had begun before: its first messages are missing\n";
    }
    if (!hasConfiguration_) {
        text += "its configuration could not be had and is missing\n";
    }
    if (leftOut_ != 0) {
        text += formatted("{} messages were left out, as they came faster than they were read\n", leftOut_);
    }
    if (large_ != 0) {
        text +=
            formatted("{} messages with large payloads are missing, as a tap does not show them\n", large_);
    }
    return text;
}

} // namespace tamblo::tools
