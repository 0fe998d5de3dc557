#pragma once

#include "platform/Counters.h"
#include "platform/ZRReportingServiceProtocol.h"
#include "wire/Reply.h"
#include "wire/Request.h"

#include <concepts>
#include <cstdint>
#include <memory>
#include <optional>
#include <utility>
#include <vector>

namespace tamblo {

/// Becomes whichever kind of reply an operation takes: one that writes its frame to the receiver, or an empty
/// one when the client asked for none.
template <typename Receiver> class ReplyTo {
public:
    ReplyTo(const wire::Request& request, Receiver& receiver)
        : id_(request.id), method_(request.method), receiver_(receiver) {}

    template <typename... Result> operator UniqueFunction<void(const ReplyError*, Result...), 32>() const {
        if (!id_) {
            return {};
        }
        return [receiver = receiver_.shared_from_this(), id = *id_, method = method_](const ReplyError* error,
                                                                                      Result... result) {
            if (error != nullptr) {
                refuse(*receiver, method, id, *error);
            } else {
                receiver->reply([&](TextBuffer& out) { append(out, id, result...); });
            }
        };
    }
    /// The same for an operation that may be refused: of a request without reply, too, the client hears that,
    /// under the id 0.
    [[nodiscard]] BooleanReply orRefusal() const {
        if (id_) {
            return *this;
        }
        return [receiver = receiver_.shared_from_this(), method = method_](const ReplyError* error, bool) {
            if (error != nullptr) {
                refuse(*receiver, method, 0, *error);
            }
        };
    }

private:
    static void refuse(Receiver& receiver, wire::Method method, std::uint64_t id, const ReplyError& error) {
        const bool isLimit = error.code == kLimitReached;
        counters::addRequestError(static_cast<std::size_t>(method),
                                  isLimit ? counters::RequestError::limit
                                          : counters::RequestError::reportingDisabled);
        if (isLimit) {
            receiver.noteLimit(error.message);
        }
        receiver.reply([&](TextBuffer& out) { wire::appendErrorReply(out, id, error); });
    }
    static void append(TextBuffer& out, std::uint64_t id) { wire::appendNullReply(out, id); }
    static void append(TextBuffer& out, std::uint64_t id, std::same_as<bool> auto result) {
        wire::appendBooleanReply(out, id, result);
    }
    static void append(TextBuffer& out, std::uint64_t id, std::same_as<std::uint16_t> auto result) {
        wire::appendUnsignedReply(out, id, result);
    }
    static void append(TextBuffer& out, std::uint64_t id, const Dictionary& result) {
        wire::appendDictionaryReply(out, id, result);
    }
    static void append(TextBuffer& out, std::uint64_t id, const std::vector<std::int64_t>& result) {
        wire::appendIntegersReply(out, id, result);
    }

    std::optional<std::uint64_t> id_;
    wire::Method method_;
    Receiver& receiver_;
};

/// Calls the object's operation for a request, whose parts are moved from. Each reply, whenever it comes and
/// from whatever thread, is handed to `receiver.reply` as a callable that appends its frame to a
/// `TextBuffer&`, and the name of a limit that is reached to `receiver.noteLimit`; the replies share the
/// ownership of the receiver, which a `std::shared_ptr` has.
template <typename Receiver>
void dispatchRequest(ZRReportingServiceProtocol& object, wire::Request& request, Receiver& receiver) {
    using wire::Method;
    const ReporterID reporterID = request.reporterID;
    const ReplyTo reply(request, receiver);
    switch (request.method) {
    case Method::createReportingSession:
        return object.createReportingSession(reporterID, reply.orRefusal());
    case Method::setServiceType:
        return object.setServiceType(request.serviceType, reporterID, reply);
    case Method::getServiceNameForReporterID:
        return object.getServiceNameForReporterID(reporterID, reply);
    case Method::setConfiguration:
        return object.setConfiguration(std::move(request.dictionary), reporterID, reply.orRefusal());
    case Method::startReportingSessionForID:
        return object.startReportingSessionForID(reporterID, reply);
    case Method::sendMessage:
        return object.sendMessage(std::move(request.dictionary), request.category, request.type,
                                  std::move(request.reporterIDs), reply);
    case Method::stopReportingSessionForID:
        return object.stopReportingSessionForID(reporterID, reply);
    case Method::destroyReportingSession:
        return object.destroyReportingSession(reporterID, reply);
    case Method::reporterID:
        return object.reporterID(reporterID, reply);
    case Method::getAllReporters:
        return object.getAllReporters(reply);
    case Method::killService:
        return object.killService();
    }
}

} // namespace tamblo
