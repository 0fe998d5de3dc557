#include "platform/linux/sinks/PayloadSize.h"

#include "base/Value.h"

namespace tamblo {

namespace {

std::size_t valueSize(const Value& value) {
    switch (value.kind()) {
    case Value::Kind::string:
        return value.stringValue().size();
    case Value::Kind::data:
        return value.dataValue().size();
    case Value::Kind::array: {
        std::size_t size = 0;
        for (const Value& element : value.arrayValue()) {
            size += valueSize(element);
        }
        return size;
    }
    case Value::Kind::dictionary:
        return payloadSize(value.dictionaryValue());
    default:
        return 0;
    }
}

} // namespace

std::size_t payloadSize(const Dictionary& payload) {
    std::size_t size = 0;
    for (std::size_t i = 0; i < payload.size(); ++i) {
        size += payload.keyAt(i).size() + valueSize(payload.valueAt(i));
    }
    return size;
}

} // namespace tamblo
