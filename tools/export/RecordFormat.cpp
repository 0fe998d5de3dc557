#include "tools/export/RecordFormat.h"

#include "base/Format.h"
#include "base/Json.h"

#include <array>
#include <utility>

namespace tamblo::tools {

namespace {

/// A line for each record: the line of the sink as `record`, and what it is.
class JsonLines final : public RecordFormat {
public:
    explicit JsonLines(ExportedDevice device) : device_(std::move(device)) {}
    void add(TextBuffer& out, const ExportedRecord& record) override {
        out.append(R"({"id":)");
        appendJsonString(out, record.identifier);
        out.append(R"(,"device":)");
        appendJsonString(out, device_.name);
        out.append(R"(,"version":)");
        appendJsonString(out, device_.version);
        out.append(R"(,"sink":)");
        appendJsonString(out, record.sink);
        out.append(R"(,"record":)");
        appendJson(out, Value(record.fields));
        out.append("}\n");
    }

private:
    const ExportedDevice device_;
};

/// Appends a text as a field of tab-separated values: a backslash, tabs and line ends are escaped.
void appendField(TextBuffer& out, std::string_view text) {
    for (const char character : text) {
        switch (character) {
        case '\\':
            out.append("\\\\");
            break;
        case '\t':
            out.append("\\t");
            break;
        case '\n':
            out.append("\\n");
            break;
        case '\r':
            out.append("\\r");
            break;
        case '\0':
            out.append("\\0");
            break;
        default:
            out.append(character);
        }
    }
}

/// A line for each record: id, device, version, sink, time in nanoseconds since 1970, event, session,
/// application, service, and the line of the sink, with tabs between them.
class Columns final : public RecordFormat {
public:
    explicit Columns(ExportedDevice device) : device_(std::move(device)) {}
    void add(TextBuffer& out, const ExportedRecord& record) override {
        const RecordColumns columns(record.fields);
        const std::string time = formatted("{}", columns.nanoseconds);
        for (const std::string_view field : std::initializer_list<std::string_view>{
                 record.identifier, device_.name, device_.version, record.sink, time, columns.event,
                 columns.session, columns.application, columns.service}) {
            appendField(out, field);
            out.append('\t');
        }
        appendField(out, jsonText(Value(record.fields)));
        out.append('\n');
    }

private:
    const ExportedDevice device_;
};

void appendKeyAndValue(TextBuffer& out, std::string_view key, const Value& value);

/// A value as OTLP's `AnyValue` in JSON: integers of 64 bits are texts.
void appendAnyValue(TextBuffer& out, const Value& value) {
    switch (value.kind()) {
    case Value::Kind::boolean:
        out.append(value.boolValue() ? R"({"boolValue":true})" : R"({"boolValue":false})");
        return;
    case Value::Kind::integer:
        out.append(formatted(R"({"intValue":"{}"})", value.rawInteger()));
        return;
    case Value::Kind::singleFloat:
    case Value::Kind::doubleFloat:
        out.append(R"({"doubleValue":)");
        appendJsonNumber(out, value.doubleValue()); // finite, as it was read from JSON
        out.append('}');
        return;
    case Value::Kind::array: {
        out.append(R"({"arrayValue":{"values":[)");
        std::string_view separator;
        for (const Value& element : value.arrayValue()) {
            out.append(std::exchange(separator, ","));
            appendAnyValue(out, element);
        }
        out.append("]}}");
        return;
    }
    case Value::Kind::dictionary: {
        out.append(R"({"kvlistValue":{"values":[)");
        const Dictionary& fields = value.dictionaryValue();
        for (std::size_t i = 0; i != fields.size(); ++i) {
            out.append(i == 0 ? "" : ",");
            appendKeyAndValue(out, fields.keyAt(i), fields.valueAt(i));
        }
        out.append("]}}");
        return;
    }
    default:
        break;
    }
    // A text; or an unsigned number beyond the signed range, which `intValue` has no place for.
    out.append(R"({"stringValue":)");
    appendJsonString(out, value.isString() ? value.stringValue() : std::string_view(jsonText(value)));
    out.append('}');
}

void appendKeyAndValue(TextBuffer& out, std::string_view key, const Value& value) {
    out.append(R"({"key":)");
    appendJsonString(out, key);
    out.append(R"(,"value":)");
    appendAnyValue(out, value);
    out.append('}');
}

/// OpenTelemetry's file format for logs (OTLP/JSON 1.x): each batch is an ExportLogsServiceRequest on a line.
class OtlpLogs final : public RecordFormat {
public:
    explicit OtlpLogs(ExportedDevice device) : device_(std::move(device)) {}
    void begin(TextBuffer& out) override {
        out.append(R"({"resourceLogs":[{"resource":{"attributes":[)");
        appendKeyAndValue(out, "service.name", "tamblod");
        out.append(',');
        appendKeyAndValue(out, "service.version", device_.version);
        if (!device_.name.empty()) {
            out.append(',');
            appendKeyAndValue(out, "device.id", device_.name);
        }
        out.append(R"(]},"scopeLogs":[{"scope":{"name":"com.vandra.tamblo"},"logRecords":[)");
        separator_ = "";
    }
    void add(TextBuffer& out, const ExportedRecord& record) override {
        const RecordColumns columns(record.fields);
        out.append(std::exchange(separator_, ","));
        out.append(
            formatted(R"({"timeUnixNano":"{}","observedTimeUnixNano":"{}","severityNumber":9,"eventName":)",
                      columns.nanoseconds, columns.nanoseconds));
        appendJsonString(out, columns.event);
        out.append(R"(,"body":)");
        appendAnyValue(out, Value(record.fields));
        out.append(R"(,"attributes":[)");
        appendKeyAndValue(out, "log.record.uid", record.identifier);
        out.append(',');
        appendKeyAndValue(out, "tamblo.sink", record.sink);
        appendAttribute(out, "tamblo.session", columns.session);
        appendAttribute(out, "tamblo.application", columns.application);
        appendAttribute(out, "tamblo.service", columns.service);
        out.append("]}");
    }
    void end(TextBuffer& out) override { out.append("]}]}]}\n"); }

private:
    static void appendAttribute(TextBuffer& out, std::string_view key, std::string_view text) {
        if (!text.empty()) {
            out.append(',');
            appendKeyAndValue(out, key, text);
        }
    }

    const ExportedDevice device_;
    std::string_view separator_;
};

template <typename Format> std::unique_ptr<RecordFormat> make(const ExportedDevice& device) {
    return std::make_unique<Format>(device);
}

constexpr auto kFormats = std::to_array<FormatRow>({
    {"json", &make<JsonLines>},
    {"otlp", &make<OtlpLogs>},
    {"protobuf", &makeProtobufRecords},
    {"columns", &make<Columns>},
});

} // namespace

std::span<const FormatRow> recordFormats() noexcept {
    return kFormats;
}

} // namespace tamblo::tools
