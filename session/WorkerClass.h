#pragma once

#include "session/ZRReportingSessionWorkerProtocol.h"

#include <memory>
#include <span>
#include <string>
#include <string_view>

namespace tamblo {

/// What a worker class is for. A worker that is neither does its work at start and stop.
struct WorkerRole {
    bool producer = false;
    bool consumer = false;
};

/// Describes one worker class. Its address is the class's identity: messages name their destinations by it.
struct WorkerClass {
    /// A worker for the session, or null when it refuses.
    using Factory = std::shared_ptr<ZRReportingSessionWorkerProtocol> (*)(
        Context&, const std::shared_ptr<ZRReportingSession>&);

    std::string_view name;
    WorkerRole role;
    /// Made and started with the session, not first when the session starts.
    bool startOnInit = false;
    bool handleSingleMessageSession = false;
    /// Null for a class that has no worker to make.
    Factory initWithSession = nullptr;
};

/// The factory of a class whose workers need nothing but their session.
template <typename Worker>
[[nodiscard]] std::shared_ptr<ZRReportingSessionWorkerProtocol>
initWithSession(Context& context, const std::shared_ptr<ZRReportingSession>& session) {
    return std::make_shared<Worker>(context, session);
}

/// All worker classes, in the order in which sessions make them. Defined outside this folder, which knows no
/// worker.
[[nodiscard]] std::span<const WorkerClass> workerClassList();

/// The class of that name, or null.
[[nodiscard]] const WorkerClass* workerClassNamed(std::string_view name) noexcept;

/// The classes that sessions make workers of: sorted out with the first call, and there as long as the
/// process. Any thread.
struct WorkerClassLists {
    std::vector<const WorkerClass*> valid;
    std::vector<const WorkerClass*> startOnInit;
};
[[nodiscard]] const WorkerClassLists& workerClassLists();

void appendText(std::string& out, const WorkerClass& workerClass);

} // namespace tamblo
