#include "base/JsonElements.h"

#include <algorithm>
#include <variant>

namespace tamblo {

namespace {

/// Whether all members' keys differ in a number of few bits that is made of each: mostly so where they
/// differ.
bool differAtAGlance(const JsonItem& object) noexcept {
    std::uint64_t seen = 0;
    for (const JsonItem* member = object.first(); member != object.end(); member = member->next()) {
        const std::string_view key = member->key;
        const std::size_t ends =
            key.empty() ? 0
                        : static_cast<unsigned char>(key.front()) + static_cast<unsigned char>(key.back());
        const std::uint64_t bit = std::uint64_t{1} << ((key.size() * 3 + ends) % 64);
        if ((seen & bit) != 0) {
            return false;
        }
        seen |= bit;
    }
    return true;
}

bool anyStandsTwice(const JsonItem& object) {
    if (differAtAGlance(object)) {
        return false;
    }
    std::vector<std::string_view> keys;
    for (const JsonItem* member = object.first(); member != object.end(); member = member->next()) {
        keys.push_back(member->key);
    }
    std::sort(keys.begin(), keys.end());
    return std::adjacent_find(keys.begin(), keys.end()) != keys.end();
}

} // namespace

const JsonItem* JsonItem::find(std::string_view name) const noexcept {
    for (const JsonItem* member = first(); member != end(); member = member->next()) {
        if (member->key == name) {
            return member->kind != Kind::null ? member : nullptr;
        }
    }
    return nullptr;
}

const JsonItem* JsonElements::next() {
    items_.clear();
    bool isClosed = false;
    if (!isBegun_) {
        isBegun_ = true;
        tokens_.skipSpace();
        if (tokens_.peek() != '[') {
            failAsValue("not an array");
            return nullptr;
        }
        (void)tokens_.takeOpening(1);
        tokens_.skipSpace();
        isClosed = tokens_.take(']');
    } else if (isEnded_ || error() || !tokens_.takeCommaOrClosing(']', isClosed)) {
        return nullptr;
    }
    if (isClosed) {
        isEnded_ = true;
        (void)tokens_.takeEnd();
        return nullptr;
    }
    return readItem({}, 1) ? items_.data() : nullptr;
}

bool JsonElements::readItem(std::string_view key, int depth) {
    JsonItem& item = items_.emplace_back();
    item.key = key;
    tokens_.skipSpace();
    switch (tokens_.peek()) {
    case '{':
        item.kind = JsonItem::Kind::object;
        return readMembers(items_.size() - 1, depth + 1);
    case '[':
        item.kind = JsonItem::Kind::array;
        return readArray(items_.size() - 1, depth + 1);
    case '"':
        item.kind = JsonItem::Kind::text;
        return tokens_.takeString(item.text);
    case 'n':
        return tokens_.takeLiteral("null");
    case 't':
        item.scalar = true;
        item.kind = JsonItem::Kind::scalar;
        return tokens_.takeLiteral("true");
    case 'f':
        item.kind = JsonItem::Kind::scalar;
        return tokens_.takeLiteral("false");
    default:
        item.kind = JsonItem::Kind::scalar;
        return tokens_.takeNumber(item.scalar);
    }
}

bool JsonElements::readArray(std::size_t array, int depth) {
    if (!tokens_.takeOpening(depth)) {
        return false;
    }
    tokens_.skipSpace();
    for (bool isClosed = tokens_.take(']'); !isClosed;) {
        if (!readItem({}, depth) || !tokens_.takeCommaOrClosing(']', isClosed)) {
            return false;
        }
    }
    items_[array].count = items_.size() - array;
    return true;
}

bool JsonElements::readMembers(std::size_t object, int depth) {
    if (!tokens_.takeOpening(depth)) {
        return false;
    }
    tokens_.skipSpace();
    for (bool isClosed = tokens_.take('}'); !isClosed;) {
        std::string_view key;
        tokens_.skipSpace();
        if (!tokens_.takeKey(key) || !readItem(key, depth) || !tokens_.takeCommaOrClosing('}', isClosed)) {
            return false;
        }
    }
    items_[object].count = items_.size() - object;
    return !anyStandsTwice(items_[object]) || failAsValue("a key stands twice in an object");
}

/// Keeps the error that reading the text as a value meets first; another one when it meets none.
bool JsonElements::failAsValue(const char* otherwise) {
    const std::variant<Value, JsonError> read = readJson(text_);
    const auto* error = std::get_if<JsonError>(&read);
    error_ = error != nullptr ? *error : JsonError{1, 1, otherwise};
    return false;
}

} // namespace tamblo
