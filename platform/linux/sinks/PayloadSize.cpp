#include "platform/linux/sinks/PayloadSize.h"

#include "base/Value.h"

namespace tamblo {

namespace {

std::size_t valueSize(const Value& value, std::size_t ofEachValue) {
    switch (value.kind()) {
    case Value::Kind::string:
        return ofEachValue + value.stringValue().size();
    case Value::Kind::data:
        return ofEachValue + value.dataValue().size();
    case Value::Kind::array: {
        std::size_t size = ofEachValue;
        for (const Value& element : value.arrayValue()) {
            size += valueSize(element, ofEachValue);
        }
        return size;
    }
    case Value::Kind::dictionary:
        return ofEachValue + payloadSize(value.dictionaryValue(), ofEachValue);
    default:
        return ofEachValue;
    }
}

} // namespace

std::size_t payloadSize(const Dictionary& payload, std::size_t ofEachValue) {
    std::size_t size = 0;
    for (std::size_t i = 0; i < payload.size(); ++i) {
        size += payload.keyAt(i).size() + valueSize(payload.valueAt(i), ofEachValue);
    }
    return size;
}

} // namespace tamblo
