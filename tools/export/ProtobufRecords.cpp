#include "metrics/ProtoWriter.h"
#include "tools/export/RecordFormat.h"

#include <cstddef>
#include <cstdint>
#include <utility>

namespace tamblo::tools {

namespace {

enum FieldOfRecord : std::uint32_t {
    kId = 1,
    kDevice,
    kVersion,
    kSink,
    kTime,
    kEvent,
    kSession,
    kApplication,
    kService,
    kFields
};
enum FieldOfValue : std::uint32_t {
    kBoolean = 1,
    kInteger,
    kUnsignedInteger,
    kNumber,
    kText,
    kList,
    kObject
};
/// The one field of `Object` and of `List`, and those of `Field`.
constexpr std::uint32_t kElements = 1;
constexpr std::uint32_t kKey = 1;
constexpr std::uint32_t kValue = 2;

/// Lengths come before what they are the lengths of: they are computed first, so that a message within others
/// is written once, to its place.
std::size_t sizeOfValue(const Value& value);

/// Of a field whose number needs one byte.
constexpr std::size_t sizeOfNested(std::size_t bytes) {
    return 1 + ProtoWriter::varintSize(bytes) + bytes;
}

/// An empty text is what a reader takes for one that is not there.
std::size_t sizeOfText(std::string_view text) {
    return text.empty() ? 0 : sizeOfNested(text.size());
}

void writeText(ProtoWriter& writer, std::uint32_t field, std::string_view text) {
    if (!text.empty()) {
        writer.string(field, text);
    }
}

std::size_t sizeOfMember(std::string_view key, const Value& value) {
    return sizeOfText(key) + sizeOfNested(sizeOfValue(value));
}

std::size_t sizeOfObject(const Dictionary& fields) {
    std::size_t size = 0;
    for (std::size_t i = 0; i != fields.size(); ++i) {
        size += sizeOfNested(sizeOfMember(fields.keyAt(i), fields.valueAt(i)));
    }
    return size;
}

std::size_t sizeOfList(const Value& value) {
    std::size_t size = 0;
    for (const Value& element : value.arrayValue()) {
        size += sizeOfNested(sizeOfValue(element));
    }
    return size;
}

std::size_t sizeOfValue(const Value& value) {
    switch (value.kind()) {
    case Value::Kind::boolean:
        return 2;
    case Value::Kind::integer:
    case Value::Kind::unsignedInteger:
        return 1 + ProtoWriter::varintSize(value.rawUnsigned());
    case Value::Kind::singleFloat:
    case Value::Kind::doubleFloat:
        return 1 + sizeof(double);
    case Value::Kind::array:
        return sizeOfNested(sizeOfList(value));
    case Value::Kind::dictionary:
        return sizeOfNested(sizeOfObject(value.dictionaryValue()));
    default:
        return sizeOfNested(value.stringValue().size());
    }
}

void writeValue(ProtoWriter writer, const Value& value);

void writeObject(ProtoWriter writer, const Dictionary& fields) {
    for (std::size_t i = 0; i != fields.size(); ++i) {
        const std::string_view key = fields.keyAt(i);
        const Value& value = fields.valueAt(i);
        writer.beginNested(kElements, sizeOfMember(key, value));
        writeText(writer, kKey, key);
        writer.beginNested(kValue, sizeOfValue(value));
        writeValue(writer, value);
    }
}

void writeValue(ProtoWriter writer, const Value& value) {
    switch (value.kind()) {
    case Value::Kind::boolean:
        writer.unsigned64(kBoolean, value.boolValue() ? 1 : 0);
        return;
    case Value::Kind::integer:
        writer.unsigned64(kInteger, value.rawUnsigned());
        return;
    case Value::Kind::unsignedInteger:
        writer.unsigned64(kUnsignedInteger, value.rawUnsigned());
        return;
    case Value::Kind::singleFloat:
    case Value::Kind::doubleFloat:
        writer.double64(kNumber, value.doubleValue());
        return;
    case Value::Kind::array:
        writer.beginNested(kList, sizeOfList(value));
        for (const Value& element : value.arrayValue()) {
            writer.beginNested(kElements, sizeOfValue(element));
            writeValue(writer, element);
        }
        return;
    case Value::Kind::dictionary:
        writer.beginNested(kObject, sizeOfObject(value.dictionaryValue()));
        writeObject(writer, value.dictionaryValue());
        return;
    default:
        writer.string(kText, value.stringValue());
    }
}

class ProtobufRecords final : public RecordFormat {
public:
    explicit ProtobufRecords(ExportedDevice device) : device_(std::move(device)) {}

    void add(TextBuffer& out, const ExportedRecord& record) override {
        const RecordColumns columns(record.fields);
        head_.clear();
        ProtoWriter head(head_);
        writeText(head, kId, record.identifier);
        writeText(head, kDevice, device_.name);
        writeText(head, kVersion, device_.version);
        writeText(head, kSink, record.sink);
        if (columns.nanoseconds != 0) {
            head.unsigned64(kTime, columns.nanoseconds);
        }
        writeText(head, kEvent, columns.event);
        writeText(head, kSession, columns.session);
        writeText(head, kApplication, columns.application);
        writeText(head, kService, columns.service);
        const std::size_t size = sizeOfObject(record.fields);
        ProtoWriter writer(out);
        writer.length(head_.size() + sizeOfNested(size));
        out.append(head_.view());
        writer.beginNested(kFields, size);
        writeObject(writer, record.fields);
    }
    void separate(TextBuffer& out) override { ProtoWriter(out).length(0); }

private:
    const ExportedDevice device_;
    TextBuffer head_;
};

} // namespace

std::unique_ptr<RecordFormat> makeProtobufRecords(const ExportedDevice& device) {
    return std::make_unique<ProtobufRecords>(device);
}

} // namespace tamblo::tools
