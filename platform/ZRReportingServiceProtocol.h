#pragma once

#include "base/Dictionary.h"
#include "base/ReplyError.h"
#include "base/UniqueFunction.h"

#include <cstdint>
#include <vector>

namespace tamblo {

/// Replies: the error, null when there is none, then the result. A reply may be called from any thread, more
/// than once or never, and after its connection is gone; it may be empty, when the client asked for no
/// answer.
using ErrorReply = UniqueFunction<void(const ReplyError*), 32>;
using BooleanReply = UniqueFunction<void(const ReplyError*, bool), 32>;
using ServiceTypeReply = UniqueFunction<void(const ReplyError*, std::uint16_t), 32>;
using DictionaryReply = UniqueFunction<void(const ReplyError*, const Dictionary&), 32>;
using ReporterIDsReply = UniqueFunction<void(const ReplyError*, const std::vector<std::int64_t>&), 32>;

using ReporterID = std::int64_t;

/// The requests of a client, as the object that a connection exports answers them. Called on the connection's
/// thread; no operation blocks.
class ZRReportingServiceProtocol {
public:
    virtual ~ZRReportingServiceProtocol() = default;

    virtual void createReportingSession(ReporterID reporterID, BooleanReply reply) = 0;
    virtual void setServiceType(std::uint16_t serviceType, ReporterID reporterID, BooleanReply reply) = 0;
    virtual void getServiceNameForReporterID(ReporterID reporterID, ServiceTypeReply reply) = 0;
    virtual void setConfiguration(Dictionary configuration, ReporterID reporterID, BooleanReply reply) = 0;
    virtual void startReportingSessionForID(ReporterID reporterID, BooleanReply reply) = 0;
    virtual void sendMessage(Dictionary message, std::uint32_t category, std::uint16_t type,
                             std::vector<ReporterID> reporterIDs, ErrorReply reply) = 0;
    virtual void stopReportingSessionForID(ReporterID reporterID, BooleanReply reply) = 0;
    virtual void destroyReportingSession(ReporterID reporterID, BooleanReply reply) = 0;
    virtual void reporterID(ReporterID reporterID, DictionaryReply reply) = 0;
    virtual void getAllReporters(ReporterIDsReply reply) = 0;
    virtual void killService() = 0;
};

} // namespace tamblo
