#pragma once

#include "os/FileDescriptor.h"
#include "platform/Counters.h"
#include "platform/StructuredLog.h"

#include <cstddef>
#include <string>

namespace tamblo {

/// The counters as a file of the runtime directory, mapped and shared: the kernel has each number as soon as
/// it is counted, so that they go on after a restart and after a kill. They begin anew with each boot, and
/// with a program whose counters are others: the file says which boot and which set of counters it is of
/// (`platform/CounterFileLayout.h`).
///
/// Where there is no such file to be had, one error line says so, and the counters last as long as the
/// process. The runtime directory is the service's own; nobody else may shorten the file under it.
class CounterFile {
public:
    /// Once the process is the only service of this directory, before it has other threads. The mapping stays
    /// until the process ends, as anything may count until then.
    void open(const std::string& runtimeDirectory, StructuredLog& log);

    /// In nanoseconds since 1970.
    [[nodiscard]] std::uint64_t began() const noexcept { return began_; }

private:
    std::uint64_t began_ = 0;
};

} // namespace tamblo
