#include "platform/linux/sinks/SinkFiles.h"

#include "platform/linux/sinks/AppendOnlyFile.h"

#include <utility>

namespace tamblo {

SinkFiles::SinkFiles(std::string directory, StructuredLog& log, FileOperations& operations)
    : directory_(std::move(directory)), log_(log), operations_(operations) {}

void SinkFiles::flush() {
    const MutexLock lock(mutex_);
    for (AppendOnlyFile* file : files_) {
        file->flush();
    }
}

void SinkFiles::add(AppendOnlyFile& file) {
    const MutexLock lock(mutex_);
    files_.push_back(&file);
}

void SinkFiles::remove(AppendOnlyFile& file) {
    const MutexLock lock(mutex_);
    std::erase(files_, &file);
}

} // namespace tamblo
