#include "platform/linux/status/RowDocuments.h"

#include "base/JsonObject.h"

namespace tamblo {

namespace {

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
                                           : "stopped")
        .number("messages", session.messages)
        .number("bytes", session.bytes)
        .number("recorded", session.recorded)
        .number("dropped", session.dropped)
        .number("seconds", std::chrono::duration<double>(session.time).count())
        .number("retained_bytes", session.retainedBytes);
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
    JsonObject(out).array("sessions", details, [](TextBuffer& text, const SessionDetail& detail) {
        JsonObject row(text);
        appendFields(row, detail.row);
        row.value("configuration", Value(detail.configuration))
            .value("previous_values", Value(detail.previousValues))
            .texts("workers", detail.workers);
    });
    return lineOf(out);
}

} // namespace tamblo
