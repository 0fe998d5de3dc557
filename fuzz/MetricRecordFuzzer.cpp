#include "tools/MetricRecord.h"

#include <cstddef>
#include <cstdint>
#include <cstdlib>
#include <map>
#include <optional>
#include <span>
#include <string>

namespace tamblo {
namespace {

using Bytes = std::span<const std::uint8_t>;

void require(bool holds) {
    if (!holds) {
        std::abort();
    }
}

/// The rules of reading once more, and in another way than the reader has them: what is left of the bytes is
/// handed on, and whoever finds too little answers nothing.
struct Model {
    std::map<std::uint64_t, std::uint64_t> numbers;
    std::map<std::uint64_t, std::string> texts;

    static std::optional<std::uint64_t> varint(Bytes& rest) {
        std::uint64_t value = 0;
        for (std::size_t i = 0; i < rest.size() && i < 10; ++i) {
            value += i == 9 ? std::uint64_t{rest[i]} << 63U : std::uint64_t{rest[i] % 128U} << (7 * i);
            if (rest[i] < 128) {
                rest = rest.subspan(i + 1);
                return value;
            }
        }
        if (rest.size() < 10) {
            return std::nullopt;
        }
        rest = rest.subspan(10);
        return 0;
    }
    static std::optional<Bytes> take(Bytes& rest, std::optional<std::uint64_t> count) {
        if (!count || *count > rest.size()) {
            return std::nullopt;
        }
        const Bytes taken = rest.first(static_cast<std::size_t>(*count));
        rest = rest.subspan(taken.size());
        return taken;
    }
    static bool skip(Bytes& rest, std::uint64_t key, int depth) {
        switch (key % 8) {
        case 0:
            return varint(rest).has_value();
        case 1:
        case 5:
            return take(rest, key % 8 == 1 ? 8 : 4).has_value();
        case 2:
            return take(rest, varint(rest)).has_value();
        case 3:
            for (auto inner = varint(rest); inner && depth > 0; inner = varint(rest)) {
                if (*inner % 8 == 4) {
                    return *inner == key + 1;
                }
                if (!skip(rest, *inner, depth - 1)) {
                    return false;
                }
            }
            return false;
        default:
            return false;
        }
    }
    bool read(Bytes rest) {
        while (!rest.empty()) {
            const auto key = varint(rest);
            if (!key || *key % 8 == 4) {
                return key.has_value();
            }
            const std::uint64_t field = *key / 8;
            if (field == 1 || field == 2) {
                const auto value = varint(rest);
                numbers[field] = value.value_or(0);
                if (!value) {
                    return false;
                }
            } else if (field >= 3 && field <= 5) {
                const auto text = take(rest, varint(rest));
                texts[field] = text ? std::string(text->begin(), text->end()) : "";
                if (!text) {
                    return false;
                }
            } else if (!skip(rest, *key, tools::ProtoReader::kMaximumDepth)) {
                return false;
            }
        }
        return true;
    }
};

/// The reader agrees with the model; what was read is written so that it reads back equal, and is shown.
void checkRecord(Bytes bytes) {
    tools::ProtoReader reader(bytes);
    qmxmetrics::AudioIssueDetected record;
    const bool isAccepted = tools::readRecord(reader, record);
    require(reader.position() <= bytes.size());
    Model model;
    require(isAccepted == model.read(bytes));
    require(record.timestamp.has_value() == model.numbers.contains(1));
    require(record.timestamp.value_or(0) == model.numbers[1]);
    require(static_cast<std::uint32_t>(record.duration) == static_cast<std::uint32_t>(model.numbers[2]));
    require(record.issuetype == model.texts[3] && record.node == model.texts[4]);
    require(record.rtaidclient == model.texts[5]);

    TextBuffer written;
    ProtoWriter writer(written);
    record.writeTo(writer);
    tools::ProtoReader again(written.bytes());
    qmxmetrics::AudioIssueDetected reread;
    require(tools::readRecord(again, reread) && again.atEnd() && reread == record);
    require(hash_value(reread) == hash_value(record));
    std::string text;
    tools::appendRecordText(text, record);
    require(text.ends_with("}\n"));
}

} // namespace
} // namespace tamblo

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* bytes, std::size_t size) {
    tamblo::checkRecord({bytes, size});
    return 0;
}
