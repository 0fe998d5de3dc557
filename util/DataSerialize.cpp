#include "util/DataSerialize.h"

#include "base/Base64.h"
#include "util/PropertyListWriter.h"

#include <algorithm>

namespace tamblo {

std::optional<std::vector<std::uint8_t>> DataSerialize::getPlistBlob(const Value& propertyList) {
    const std::optional<std::string> text = PropertyListWriter::write(propertyList);
    if (!text) {
        return std::nullopt;
    }
    return std::vector<std::uint8_t>(text->begin(), text->end());
}

std::optional<std::string> DataSerialize::getXMLInfo(const Value& propertyList) {
    std::optional<std::string> text = PropertyListWriter::write(propertyList);
    const auto isNotAscii = [](char character) { return static_cast<unsigned char>(character) >= 0x80; };
    if (text && std::any_of(text->begin(), text->end(), isNotAscii)) {
        return std::nullopt;
    }
    return text;
}

std::optional<std::string> DataSerialize::getDataXMLInfo(const Value& propertyList) {
    return PropertyListWriter::write(propertyList);
}

std::optional<std::string> DataSerialize::getBase64XMLBlob(const Value& propertyList) {
    const std::optional<std::vector<std::uint8_t>> blob = getPlistBlob(propertyList);
    if (!blob) {
        return std::nullopt;
    }
    return encodeBase64(*blob);
}

} // namespace tamblo
