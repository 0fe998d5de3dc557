#include "session/WorkerClass.h"
#include "workers/sinks/ZRReportingSessionEventryWorker.h"

#include <array>

namespace tamblo {

namespace {

constexpr WorkerRole kProducer{.producer = true, .consumer = false};
constexpr WorkerRole kConsumer{.producer = false, .consumer = true};
constexpr WorkerRole kProducerAndConsumer{.producer = true, .consumer = true};
constexpr WorkerRole kWorkerOnly{};

/// The flags: made with the session; takes part in the single-message session.
constexpr std::array<WorkerClass, 17> kWorkerClasses{{
    {"ZRReportingSessionTraceWorker", kWorkerOnly, false, false, nullptr},
    {"ZRReportingSessionVolumeMessagesWorker", kProducer, false, false, nullptr},
    {"ZRReportingSessionKaleenMessagesWorker", kProducer, false, false, nullptr},
    {"ZRReportingSessionSummaryWorker", kProducerAndConsumer, false, false, nullptr},
    {"ZRReportingSessionInputMessagesWorker", kProducer, false, false, nullptr},
    {"ZRReportingSessionEventryWorker", kConsumer, true, true,
     ZRReportingSessionEventryWorker::initWithSession},
    {"ZRReportingSessionJouleryWorker", kConsumer, true, true, nullptr},
    {"ZRReportingSessionMemoryLogWorker", kConsumer, true, false, nullptr},
    {"ZRReportingSessionQMXWorker", kConsumer, true, true, nullptr},
    {"ZRReportingSessionDriverSnapshotWorker", kProducer, false, false, nullptr},
    {"ZRReportingSessionSystemMonitorWorker", kProducer, false, false, nullptr},
    {"ZRReportingSessionZephWorker", kConsumer, false, true, nullptr},
    {"ZRReportingSessionDPWorker", kConsumer, false, false, nullptr},
    {"ZRReportingSessionSummaryJsonFileWorker", kWorkerOnly, false, false, nullptr},
    {"ZRReportingSessionAudioRegistrationWorker", kConsumer, false, false, nullptr},
    {"ZRReportingSessionRtcWorker", kConsumer, false, true, nullptr},
    {"ZRReportingSessionQuilletWorker", kConsumer, false, true, nullptr},
}};

} // namespace

std::span<const WorkerClass> workerClassList() {
    return kWorkerClasses;
}

} // namespace tamblo
