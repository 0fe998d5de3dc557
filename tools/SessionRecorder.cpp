#include "tools/SessionRecorder.h"

#include "base/Format.h"
#include "base/Json.h"
#include "client/Vocabulary.h"
#include "tools/records/Payload.h"

#include <limits>
#include <utility>
#include <variant>

namespace tamblo::tools {

namespace {

/// What the service says of itself in an `open` line, beside the session's configuration, which wins.
constexpr std::string_view kClientNameKey = "ClientName";
constexpr std::string_view kClientName = "com.vandra.tamblo";
constexpr std::string_view kSessionIDKey = "ZRReportingSessionID";
constexpr std::string_view kServiceNameKey = "ServiceName";
/// Behind a service's name, but for the single-message session.
constexpr std::string_view kSessionEnding = "_session";

const Dictionary& dictionaryAt(const Dictionary& record, std::string_view key) {
    static const Dictionary none;
    const Value* const value = record.find(key);
    return value != nullptr && value->isDictionary() ? value->dictionaryValue() : none;
}

std::string_view textAt(const Dictionary& record, std::string_view key) {
    const Value* const value = record.find(key);
    return value != nullptr ? value->stringValue() : std::string_view();
}

double numberAt(const Dictionary& record, std::string_view key) {
    const Value* const value = record.find(key);
    return value != nullptr && value->isNumber() ? value->doubleValue() : 0;
}

FoundSession sessionOf(const Dictionary& record, SinkSnapshot::Place place) {
    const Dictionary& info = dictionaryAt(record, "sessionInfo");
    FoundSession session{.name = std::string(textAt(record, "session")),
                         .place = place,
                         .start = numberAt(record, "time"),
                         .configuration = dictionaryAt(record, "userInfo")};
    if (const Value* reporter = info.find("SessionID")) {
        session.reporterID = reporter->integerValue();
    }
    std::string_view service = textAt(session.configuration, kServiceNameKey);
    if (service.ends_with(kSessionEnding)) {
        service.remove_suffix(kSessionEnding.size());
    }
    if (client::parseServiceType(service)) {
        session.serviceType = service;
        session.configuration.remove(kServiceNameKey);
    }
    if (textAt(session.configuration, kClientNameKey) == kClientName) {
        session.configuration.remove(kClientNameKey);
    }
    session.configuration.remove(kSessionIDKey);
    return session;
}

bool isWanted(const FoundSession& session, const WantedSession& wanted) {
    return (!wanted.name || session.name == *wanted.name) &&
           (!wanted.reporterID || session.reporterID == *wanted.reporterID) &&
           (!wanted.application ||
            textAt(session.configuration, "HostApplicationDisplayID") == *wanted.application);
}

std::string memberText(std::string_view key, std::string_view text) {
    return formatted("\"{}\":{}", key, jsonText(Value(text)));
}

/// The record that a line is, or nothing.
std::optional<Dictionary> recordOf(std::string_view line) {
    auto parsed = parseJsonObject(line);
    auto* const record = std::get_if<Dictionary>(&parsed);
    return record != nullptr ? std::optional(std::move(*record)) : std::nullopt;
}

template <typename Number>
std::optional<Number> wholeNumberAt(const Dictionary& record, std::string_view key) {
    const Value* const value = record.find(key);
    if (value == nullptr || !value->isNumber() || value->doubleValue() < 0 ||
        value->doubleValue() > std::numeric_limits<Number>::max()) {
        return std::nullopt;
    }
    return static_cast<Number>(value->unsignedValue());
}

/// The message that a record of the session is; nothing when it is none.
std::optional<RecordedMessage> messageOf(const Dictionary& record, double start) {
    const auto kind = wholeNumberAt<std::uint16_t>(record, "category");
    const auto type = wholeNumberAt<std::uint16_t>(record, "type");
    const Value* const payload = record.find("payload");
    if (!kind || !type || payload == nullptr || !payload->isDictionary()) {
        return std::nullopt;
    }
    const Dictionary& values = payload->dictionaryValue();
    return RecordedMessage{.offset = numberAt(record, "time") - start,
                           .category = categoryOfKind(*kind, *type, values),
                           .type = *type,
                           .payload = values};
}

} // namespace

std::optional<FoundSession> findSession(SinkSnapshot& sink, const WantedSession& wanted) {
    const std::string isOpenLine = memberText("op", "open");
    const std::string isOfWanted = wanted.name ? memberText("session", *wanted.name) : std::string();
    std::optional<FoundSession> found;
    SinkSnapshot::LineFunction look = [&](std::string_view line, SinkSnapshot::Place place) {
        const bool mayOpen = line.find(isOpenLine) != line.npos;
        const bool mayBegin = wanted.name && !found && line.find(isOfWanted) != line.npos;
        const std::optional<Dictionary> record = mayOpen || mayBegin ? recordOf(line) : std::nullopt;
        if (record && textAt(*record, "op") == "open") {
            FoundSession session = sessionOf(*record, place);
            if (isWanted(session, wanted)) {
                found = std::move(session);
            }
        } else if (record && mayBegin && textAt(*record, "session") == *wanted.name) {
            found = FoundSession{.name = *wanted.name,
                                 .place = place,
                                 .start = numberAt(*record, "time"),
                                 .hasOpenLine = false};
        }
        return true;
    };
    sink.read({}, look);
    return found;
}

RecordingReport recordSession(SinkSnapshot& sink, const FoundSession& session, SessionFileWriter& writer) {
    RecordingReport report;
    const std::string isOfSession = memberText("session", session.name);
    if (session.hasOpenLine) {
        writer.writeHeader(
            session.serviceType, session.configuration,
            {{"name", session.name}, {"reporter", session.reporterID}, {"time", session.start}});
    }
    bool isOpen = false;
    SinkSnapshot::LineFunction take = [&](std::string_view line, SinkSnapshot::Place) {
        if (line.find(isOfSession) == line.npos) {
            return true;
        }
        const std::optional<Dictionary> record = recordOf(line);
        if (!record) {
            ++report.unreadable;
            return true;
        }
        if (textAt(*record, "session") != session.name) {
            return true;
        }
        const std::string_view operation = textAt(*record, "op");
        if (operation == "open") {
            // A second one is another session that somebody has given the name.
            return !std::exchange(isOpen, true);
        }
        if (operation == "flush") {
            report.hasStopped = true;
            return false;
        }
        if (auto message = messageOf(*record, session.start)) {
            report.withoutNull +=
                std::holds_alternative<std::string>(parseJsonObject(line, kForService)) ? 1 : 0;
            writer.take(*std::move(message));
        } else {
            ++report.unreadable;
        }
        return true;
    };
    sink.read(session.place, take);
    report.passedOver = sink.passedOver();
    return report;
}

} // namespace tamblo::tools
