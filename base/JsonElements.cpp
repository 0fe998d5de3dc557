#include "base/JsonElements.h"

#include <algorithm>
#include <variant>

namespace tamblo {

namespace {

bool anyStandsTwice(std::vector<std::string_view>& keys) {
    constexpr std::size_t kFew = 16; // up to which comparing each with each is quicker than sorting
    if (keys.size() > kFew) {
        std::sort(keys.begin(), keys.end());
        return std::adjacent_find(keys.begin(), keys.end()) != keys.end();
    }
    for (auto key = keys.begin(); key != keys.end(); ++key) {
        if (std::find(keys.begin(), key, *key) != key) {
            return true;
        }
    }
    return false;
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
    keys_.clear();
    const JsonItem& item = items_[object];
    for (const JsonItem* member = item.first(); member != item.end(); member = member->next()) {
        keys_.push_back(member->key);
    }
    return !anyStandsTwice(keys_) || failAsValue("a key stands twice in an object");
}

/// Keeps the error that reading the text as a value meets first; another one when it meets none.
bool JsonElements::failAsValue(const char* otherwise) {
    const std::variant<Value, JsonError> read = readJson(text_);
    const auto* error = std::get_if<JsonError>(&read);
    error_ = error != nullptr ? *error : JsonError{1, 1, otherwise};
    return false;
}

} // namespace tamblo
