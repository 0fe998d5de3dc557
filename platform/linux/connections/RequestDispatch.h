#pragma once

#include "platform/ZRReportingServiceProtocol.h"
#include "wire/Reply.h"
#include "wire/Request.h"

#include <cstdint>
#include <memory>
#include <type_traits>
#include <utility>
#include <vector>

namespace tamblo {

namespace detail {

/// Appends the frame of a reply with a result of whatever type.
template <typename Result> void appendReplyFrame(TextBuffer& out, std::uint64_t id, Result result) {
    if constexpr (std::is_same_v<Result, bool>) {
        wire::appendBooleanReply(out, id, result);
    } else if constexpr (std::is_same_v<Result, std::uint16_t>) {
        wire::appendUnsignedReply(out, id, result);
    } else if constexpr (std::is_same_v<Result, const Dictionary&>) {
        wire::appendDictionaryReply(out, id, result);
    } else {
        wire::appendIntegersReply(out, id, result);
    }
}

/// A reply that writes its frame to the receiver; an empty one when the client asked for none.
template <typename Reply, typename... Result, typename Receiver>
Reply replyTo(const wire::Request& request, const std::shared_ptr<Receiver>& receiver) {
    if (!request.id) {
        return {};
    }
    return [receiver, id = *request.id](const ReplyError* error, Result... result) {
        receiver->reply([&](TextBuffer& out) {
            if (error != nullptr) {
                wire::appendErrorReply(out, id, {error->domain, error->code, {}});
            } else if constexpr (sizeof...(Result) == 0) {
                wire::appendNullReply(out, id);
            } else {
                appendReplyFrame<Result...>(out, id, result...);
            }
        });
    };
}

} // namespace detail

/// Calls the object's operation for a request, whose parts are moved from. Each reply, whenever it comes and
/// from whatever thread, is handed to `receiver->reply` as a callable that appends its frame to a
/// `TextBuffer&`; the replies share the receiver's ownership.
template <typename Receiver>
void dispatchRequest(ZRReportingServiceProtocol& object, wire::Request& request,
                     const std::shared_ptr<Receiver>& receiver) {
    using namespace detail;
    const ReporterID reporterID = request.reporterID;
    const auto booleanReply = [&] { return replyTo<BooleanReply, bool>(request, receiver); };
    switch (request.method) {
    case wire::Method::createReportingSession:
        object.createReportingSession(reporterID, booleanReply());
        break;
    case wire::Method::setServiceType:
        object.setServiceType(request.serviceType, reporterID, booleanReply());
        break;
    case wire::Method::getServiceNameForReporterID:
        object.getServiceNameForReporterID(reporterID,
                                           replyTo<ServiceTypeReply, std::uint16_t>(request, receiver));
        break;
    case wire::Method::setConfiguration:
        object.setConfiguration(std::move(request.dictionary), reporterID, booleanReply());
        break;
    case wire::Method::startReportingSessionForID:
        object.startReportingSessionForID(reporterID, booleanReply());
        break;
    case wire::Method::sendMessage:
        object.sendMessage(std::move(request.dictionary), request.category, request.type,
                           std::move(request.reporterIDs), replyTo<ErrorReply>(request, receiver));
        break;
    case wire::Method::stopReportingSessionForID:
        object.stopReportingSessionForID(reporterID, booleanReply());
        break;
    case wire::Method::destroyReportingSession:
        object.destroyReportingSession(reporterID, booleanReply());
        break;
    case wire::Method::reporterID:
        object.reporterID(reporterID, replyTo<DictionaryReply, const Dictionary&>(request, receiver));
        break;
    case wire::Method::getAllReporters:
        object.getAllReporters(
            replyTo<ReporterIDsReply, const std::vector<std::int64_t>&>(request, receiver));
        break;
    case wire::Method::killService:
        object.killService();
        break;
    }
}

} // namespace tamblo
