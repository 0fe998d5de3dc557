// Any bytes as the file that a sink finds at its start: whole lines stay as they are, what stands behind the
// last line end is cut off, and what is appended follows it, or begins a new file where the old one is full.

#include "Demand.h"
#include "platform/linux/sinks/AppendOnlyFile.h"

#include <algorithm>
#include <cstdint>

namespace tamblo {
namespace {

void append(std::string_view found, std::size_t fileSize) {
    static const fuzz::ScratchDirectory directory;
    static fuzz::SilentLog log;
    constexpr std::string_view kLine = "a line that is added";
    std::error_code ignored;
    std::filesystem::remove(directory.path("sink.jsonl.1"), ignored);
    directory.write("sink.jsonl", found);
    {
        SinkFiles files(directory.path(), log);
        AppendOnlyFile sink(files, "sink.jsonl", "zrrs", AppendOnlyFile::Flushed::beforeReplies,
                            {.fileSize = fileSize});
        sink.append([&](TextBuffer& line) { line.append(kLine); });
        files.flush();
    }
    const std::string whole(found.substr(0, found.rfind('\n') + 1)); // npos + 1 is none
    const std::string added = std::string(kLine) + "\n";
    const bool isFull = !whole.empty() && whole.size() + added.size() > fileSize;
    fuzz::demand(directory.read("sink.jsonl") == (isFull ? added : whole + added));
    fuzz::demand(directory.read("sink.jsonl.1") == (isFull ? whole : ""));
}

} // namespace
} // namespace tamblo

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* bytes, std::size_t size) {
    const std::string_view content(reinterpret_cast<const char*>(bytes), size);
    // As long as what is found and a line take, give or take a little; and longer than one block is read.
    tamblo::append(content, std::max<std::size_t>(size + size % 64, 40));
    std::string large(200'000 + size % 7, 'x');
    large.insert(size % 3 == 0 ? 0 : 70'000, content);
    tamblo::append(large, 1U << 20U);
    return 0;
}
