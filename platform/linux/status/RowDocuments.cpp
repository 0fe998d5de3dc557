#include "platform/linux/status/RowDocuments.h"

#include "base/JsonObject.h"

#include <cstddef>

namespace tamblo {

namespace {

/// In memory: as text, each may take six times as much. The sessions of one reporter may be thousands, and
/// have all that their users may have retained.
constexpr std::size_t kMostBytesOfValue = 64U << 10U;
constexpr std::size_t kMostBytesOfValues = 1U << 20U;

void appendName(JsonObject& row, const std::optional<std::string>& name) {
    if (name) {
        row.text("process", *name);
    } else {
        row.null("process");
    }
}

void appendClient(TextBuffer& out, const ClientRow& client) {
    JsonObject row(out);
    row.number("client", client.order)
        .number("pid", client.identity.process)
        .number("uid", client.identity.user);
    appendName(row, client.processName);
    if (client.connected) {
        row.number("connected", secondsSince1970(*client.connected));
    }
    row.number("requests", client.requests)
        .number("messages", client.messages)
        .number("bytes", client.bytes)
        .number("seconds", std::chrono::duration<double>(client.time).count())
        .number("sessions", client.sessions)
        .number("started_sessions", client.startedSessions)
        .number("retained_bytes", client.retainedBytes);
}

void appendFields(JsonObject& row, const SessionRow& session) {
    row.number("reporter", session.reporterID)
        .number("client", session.clientOrder)
        .number("pid", session.owner.process)
        .number("uid", session.owner.user);
    appendName(row, session.processName);
    row.text("application", session.application)
        .number("service_type", session.serviceType)
        .text("service", session.serviceName)
        .text("state", session.isStopping  ? "stopping"
                       : session.isStarted ? "started"
                                           : "stopped");
    if (session.start && session.length) {
        row.number("start", secondsSince1970(*session.start))
            .number("length", std::chrono::duration<double>(*session.length).count());
    }
    row.number("messages", session.messages)
        .number("bytes", session.bytes)
        .number("recorded", session.recorded)
        .number("dropped", session.dropped)
        .number("seconds", std::chrono::duration<double>(session.time).count())
        .number("retained_bytes", session.retainedBytes);
}

/// The values that are shown: those that take much are left out, and all once there is no room.
Dictionary withinRoom(const Dictionary& values, std::size_t& room, std::size_t& leftOut) {
    Dictionary shown = values;
    for (std::size_t i = 0; i != values.size(); ++i) {
        const std::size_t bytes = values.keyAt(i).size() + sizeof(Value) + values.valueAt(i).heldBytes();
        if (bytes > kMostBytesOfValue || bytes > room) {
            shown.remove(values.keyAt(i));
            ++leftOut;
        } else {
            room -= bytes;
        }
    }
    return shown;
}

std::string lineOf(const TextBuffer& out) {
    return std::string(out.view()).append("\n");
}

} // namespace

std::string clientsDocument(const std::vector<ClientRow>& rows) {
    TextBuffer out;
    JsonObject(out).array("clients", rows, appendClient);
    return lineOf(out);
}

std::string sessionsDocument(const std::vector<SessionRow>& rows) {
    TextBuffer out;
    JsonObject(out).array("sessions", rows, [](TextBuffer& text, const SessionRow& session) {
        JsonObject row(text);
        appendFields(row, session);
    });
    return lineOf(out);
}

std::string sessionDocument(const std::vector<SessionDetail>& details) {
    TextBuffer out;
    std::size_t room = kMostBytesOfValues;
    JsonObject(out).array("sessions", details, [&room](TextBuffer& text, const SessionDetail& detail) {
        std::size_t leftOut = 0;
        JsonObject row(text);
        appendFields(row, detail.row);
        row.value("configuration", Value(withinRoom(detail.configuration, room, leftOut)))
            .value("previous_values", Value(withinRoom(detail.previousValues, room, leftOut)))
            .texts("workers", detail.workers);
        if (leftOut != 0) {
            row.number("values_left_out", leftOut);
        }
    });
    return lineOf(out);
}

} // namespace tamblo
