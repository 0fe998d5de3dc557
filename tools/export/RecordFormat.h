#pragma once

#include "base/Dictionary.h"
#include "base/TextBuffer.h"

#include <cstdint>
#include <memory>
#include <optional>
#include <span>
#include <string>
#include <string_view>

namespace tamblo::tools {

/// What is said of every record of an export.
struct ExportedDevice {
    std::string name;
    std::string version; ///< of what exports
};

/// Arrays and objects within one another, the line among them: a payload has 32 at most. Readers of Protocol
/// Buffers refuse more than 100 messages within one another, of which each level takes three; and with one
/// message they refuse all that stands behind it.
inline constexpr int kMostLevelsOfRecord = 33;

/// A line of a sink on its way to an engine.
struct ExportedRecord {
    /// As `RecordIdentifiers` makes it: the same whenever the line is exported, so that repeats can be left
    /// out.
    std::string identifier;
    std::string_view sink;
    const Dictionary& fields; ///< the line
};

/// How records are written. A batch is begun, given its records, and ended.
class RecordFormat {
public:
    virtual ~RecordFormat() = default;
    virtual void begin(TextBuffer& /*out*/) {}
    virtual void add(TextBuffer& out, const ExportedRecord& record) = 0;
    virtual void end(TextBuffer& /*out*/) {}
    /// What stands between two batches where the reader is to see it: an empty line, or an empty message.
    virtual void separate(TextBuffer& out) { out.append('\n'); }
};

/// Messages of `packaging/exported_record.proto`, each behind its length as a varint.
[[nodiscard]] std::unique_ptr<RecordFormat> makeProtobufRecords(const ExportedDevice& device);

struct FormatRow {
    std::string_view name;
    std::unique_ptr<RecordFormat> (*make)(const ExportedDevice& device);
};
/// json, otlp, protobuf, columns.
[[nodiscard]] std::span<const FormatRow> recordFormats() noexcept;

/// The fields by which engines sort and select, wherever in a line they stand; but for the event, empty where
/// it has none.
struct RecordColumns {
    explicit RecordColumns(const Dictionary& record);

    std::uint64_t nanoseconds = 0; ///< since 1970; 0 of a line without a time
    std::string event;             ///< as `nameOfRecord` has it
    std::string_view session;      ///< the call-quality file's and that of captures
    std::string_view application;
    std::string_view service; ///< type of a session
};

} // namespace tamblo::tools
