#include "tools/Decode.h"

#include "base/Base64.h"
#include "base/Format.h"
#include "base/Json.h"
#include "base/Rfc3339.h"
#include "base/SplitText.h"
#include "tools/MetricRecord.h"
#include "tools/records/Payload.h"
#include "tools/records/SinkFile.h"

#include <algorithm>
#include <array>

namespace tamblo::tools {

namespace {

constexpr std::array<std::string_view, 3> kKindNames{"record", "line", "frame"};

/// What is wrong with the record, if anything; what could be read of it is shown all the same.
std::optional<std::string> appendRecord(std::string& out, std::string_view base64) {
    const auto bytes = decodeBase64(base64);
    if (!bytes) {
        return "not Base64";
    }
    ProtoReader reader(*bytes);
    qmxmetrics::AudioIssueDetected record;
    const bool isWhole = readRecord(reader, record);
    appendRecordText(out, record);
    if (!record.timestamp) {
        out += "# timestamp is not set\n";
    }
    if (!isWhole) {
        return formatted("not a whole metric record: byte {} of {} is the last that could be read",
                         reader.position(), bytes->size());
    }
    if (!reader.atEnd()) {
        return formatted("{} bytes follow the end of the record", bytes->size() - reader.position());
    }
    return std::nullopt;
}

/// One entry a line, dictionaries indented below their key.
void appendEntries(std::string& out, const Dictionary& entries, std::size_t depth) {
    for (std::size_t i = 0; i < entries.size(); ++i) {
        const Value& value = entries.valueAt(i);
        out.append(2 * depth, ' ').append(plainText(Value(entries.keyAt(i)))).append(":");
        if (value.isDictionary() && !value.dictionaryValue().empty()) {
            out += '\n';
            appendEntries(out, value.dictionaryValue(), depth + 1);
        } else {
            out.append(" ").append(jsonText(value)).append("\n");
        }
    }
}

bool isAudioIssue(const Dictionary& fields) {
    const Value* const metric = fields.find("metric");
    return metric != nullptr && *metric == Value(qmxmetrics::kAudioIssueMetric);
}

std::optional<std::string> appendLine(std::string& out, std::string_view line) {
    auto read = parseJsonObject(line);
    if (const auto* wrong = std::get_if<std::string>(&read)) {
        return *wrong;
    }
    Dictionary fields = std::get<Dictionary>(std::move(read));
    const Value* time = fields.find("time");
    if (time == nullptr || !time->isNumber()) {
        return std::string("not a line of a report sink: those have a \"time\"");
    }
    out += formatted("{} {}\n", formatRfc3339(time->doubleValue()).value_or("-"),
                     plainText(Value(nameOfRecord(fields))));
    appendEntries(out, fields, 1);
    if (std::holds_alternative<std::string>(parseJsonObject(line, kForService))) {
        out += "# a null is left out: a number that is not finite\n";
    }
    if (!isAudioIssue(fields)) {
        return std::nullopt;
    }
    const Value* record = fields.find("record");
    if (record == nullptr || !record->isString()) {
        return std::string("there is no record");
    }
    if (auto wrong = appendRecord(out, record->stringValue())) {
        return "the record is " + *wrong;
    }
    return std::nullopt;
}

using AppendOne = std::optional<std::string> (*)(std::string& out, std::string_view text);

/// Each line that is not blank on its own.
Decoded decodeLines(std::string_view input, AppendOne appendOne) {
    Decoded decoded;
    std::size_t number = 0;
    while (!input.empty()) {
        const std::string_view line = trimmed(takeUpTo('\n', input));
        ++number;
        if (line.empty()) {
            continue;
        }
        if (auto wrong = appendOne(decoded.text, line)) {
            decoded.problems.push_back(formatted("line {}: {}", number, *wrong));
        }
    }
    return decoded;
}

} // namespace

std::optional<EncodedKind> encodedKindNamed(std::string_view name) noexcept {
    const auto* const found = std::find(kKindNames.begin(), kKindNames.end(), name);
    return found == kKindNames.end() ? std::nullopt
                                     : std::optional(static_cast<EncodedKind>(found - kKindNames.begin()));
}

std::string_view nameOf(EncodedKind kind) noexcept {
    return kKindNames[static_cast<std::size_t>(kind)];
}

EncodedKind guessEncodedKind(std::string_view input) {
    const bool isBinary = input.find('\0') != std::string_view::npos;
    if (!isBinary && trimmed(input).starts_with('{')) {
        return EncodedKind::line;
    }
    return isBinary || isHex(input) ? EncodedKind::frame : EncodedKind::record;
}

std::optional<Dictionary> fieldsOfMetric(const Dictionary& line) {
    const Value* const encoded = line.find("record");
    const auto bytes =
        encoded != nullptr && isAudioIssue(line) ? decodeBase64(encoded->stringValue()) : std::nullopt;
    if (!bytes) {
        return std::nullopt;
    }
    ProtoReader reader(*bytes);
    qmxmetrics::AudioIssueDetected record;
    if (!readRecord(reader, record) || !reader.atEnd()) {
        return std::nullopt;
    }
    Dictionary fields{{"duration", record.duration},
                      {"issuetype", record.issuetype},
                      {"node", record.node},
                      {"rtaidclient", record.rtaidclient}};
    if (record.timestamp) {
        fields.set("timestamp", *record.timestamp);
    }
    return fields;
}

Decoded decode(std::string_view input, EncodedKind kind) {
    const AppendOne appendOne = kind == EncodedKind::record ? appendRecord : appendLine;
    Decoded decoded = kind == EncodedKind::frame ? decodeFrames(input) : decodeLines(input, appendOne);
    if (decoded.text.empty() && decoded.problems.empty()) {
        decoded.problems.emplace_back("there is nothing to decode");
    }
    return decoded;
}

} // namespace tamblo::tools
