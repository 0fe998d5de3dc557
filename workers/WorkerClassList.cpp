#include "session/WorkerClass.h"
#include "system/ZRReportingSessionDriverSnapshotWorker.h"
#include "system/ZRReportingSessionSystemMonitorWorker.h"
#include "workers/accessories/ZRReportingSessionAudioRegistrationWorker.h"
#include "workers/producers/ZRReportingSessionInputMessagesWorker.h"
#include "workers/producers/ZRReportingSessionKaleenMessagesWorker.h"
#include "workers/producers/ZRReportingSessionSummaryWorker.h"
#include "workers/producers/ZRReportingSessionVolumeMessagesWorker.h"
#include "workers/sinks/ZRReportingSessionDPWorker.h"
#include "workers/sinks/ZRReportingSessionEventryWorker.h"
#include "workers/sinks/ZRReportingSessionJouleryWorker.h"
#include "workers/sinks/ZRReportingSessionMemoryLogWorker.h"
#include "workers/sinks/ZRReportingSessionQMXWorker.h"
#include "workers/sinks/ZRReportingSessionQuilletWorker.h"
#include "workers/sinks/ZRReportingSessionRtcWorker.h"
#include "workers/sinks/ZRReportingSessionSummaryJsonFileWorker.h"
#include "workers/sinks/ZRReportingSessionZephWorker.h"
#include "workers/trace/ZRReportingSessionTraceWorker.h"

#include <array>

namespace tamblo {

namespace {

constexpr WorkerRole kProducer{.producer = true, .consumer = false};
constexpr WorkerRole kConsumer{.producer = false, .consumer = true};
constexpr WorkerRole kProducerAndConsumer{.producer = true, .consumer = true};
constexpr WorkerRole kWorkerOnly{};

constexpr std::array<WorkerClass, 17> kWorkerClasses{{
    {.name = "ZRReportingSessionTraceWorker",
     .role = kWorkerOnly,
     .initWithSession = ZRReportingSessionTraceWorker::initWithSession},
    {.name = "ZRReportingSessionVolumeMessagesWorker",
     .role = kProducer,
     .initWithSession = initWithSession<ZRReportingSessionVolumeMessagesWorker>},
    {.name = "ZRReportingSessionKaleenMessagesWorker",
     .role = kProducer,
     .initWithSession = initWithSession<ZRReportingSessionKaleenMessagesWorker>},
    {.name = "ZRReportingSessionSummaryWorker",
     .role = kProducerAndConsumer,
     .initWithSession = initWithSession<ZRReportingSessionSummaryWorker>},
    {.name = "ZRReportingSessionInputMessagesWorker",
     .role = kProducer,
     .initWithSession = initWithSession<ZRReportingSessionInputMessagesWorker>},
    {.name = "ZRReportingSessionEventryWorker",
     .role = kConsumer,
     .startOnInit = true,
     .handleSingleMessageSession = true,
     .initWithSession = initWithSession<ZRReportingSessionEventryWorker>},
    {.name = "ZRReportingSessionJouleryWorker",
     .role = kConsumer,
     .startOnInit = true,
     .handleSingleMessageSession = true,
     .initWithSession = initWithSession<ZRReportingSessionJouleryWorker>},
    {.name = "ZRReportingSessionMemoryLogWorker",
     .role = kConsumer,
     .startOnInit = true,
     .initWithSession = initWithSession<ZRReportingSessionMemoryLogWorker>},
    {.name = "ZRReportingSessionQMXWorker",
     .role = kConsumer,
     .startOnInit = true,
     .handleSingleMessageSession = true,
     .initWithSession = initWithSession<ZRReportingSessionQMXWorker>},
    {.name = "ZRReportingSessionDriverSnapshotWorker",
     .role = kProducer,
     .initWithSession = initWithSession<ZRReportingSessionDriverSnapshotWorker>},
    {.name = "ZRReportingSessionSystemMonitorWorker",
     .role = kProducer,
     .initWithSession = initWithSession<ZRReportingSessionSystemMonitorWorker>},
    {.name = "ZRReportingSessionZephWorker",
     .role = kConsumer,
     .handleSingleMessageSession = true,
     .initWithSession = ZRReportingSessionZephWorker::initWithSession},
    {.name = "ZRReportingSessionDPWorker",
     .role = kConsumer,
     .initWithSession = ZRReportingSessionDPWorker::initWithSession},
    {.name = "ZRReportingSessionSummaryJsonFileWorker",
     .role = kWorkerOnly,
     .initWithSession = ZRReportingSessionSummaryJsonFileWorker::initWithSession},
    {.name = "ZRReportingSessionAudioRegistrationWorker",
     .role = kConsumer,
     .initWithSession = initWithSession<ZRReportingSessionAudioRegistrationWorker>},
    {.name = "ZRReportingSessionRtcWorker",
     .role = kConsumer,
     .handleSingleMessageSession = true,
     .initWithSession = ZRReportingSessionRtcWorker::initWithSession},
    {.name = "ZRReportingSessionQuilletWorker",
     .role = kConsumer,
     .handleSingleMessageSession = true,
     .initWithSession = ZRReportingSessionQuilletWorker::initWithSession},
}};

} // namespace

std::span<const WorkerClass> workerClassList() {
    return kWorkerClasses;
}

} // namespace tamblo
