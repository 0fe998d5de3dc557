#pragma once

#include "base/Mutex.h"
#include "os/FileOperations.h"
#include "platform/StructuredLog.h"

#include <string>
#include <vector>

namespace tamblo {

class AppendOnlyFile;

/// The files of all sinks: where they stand, what tells of their failures, and the one place from which they
/// are written out. A file cannot be made without it, so that none is forgotten when replies are about to
/// leave. Made by whoever wires the platform; outlives the sinks. Any thread.
class SinkFiles {
public:
    /// Log and operations must outlive this object.
    SinkFiles(std::string directory, StructuredLog& log,
              FileOperations& operations = FileOperations::system());

    /// Writes out what waits in all files that are written before replies. It costs a look at each file where
    /// nothing waits; returns when what was appended before the call, on any thread, is in the kernel's
    /// hands, or lost and counted.
    void flush();

private:
    friend class AppendOnlyFile;
    void add(AppendOnlyFile& file);
    void remove(AppendOnlyFile& file);

    const std::string directory_;
    StructuredLog& log_;
    FileOperations& operations_;

    Mutex mutex_;
    std::vector<AppendOnlyFile*> files_ TAMBLO_GUARDED_BY(mutex_);
};

} // namespace tamblo
