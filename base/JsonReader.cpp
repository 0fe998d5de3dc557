#include "base/Json.h"

#include "base/Format.h"
#include "base/JsonTokens.h"
#include "base/KeySetCache.h"

#include <algorithm>
#include <cstdint>
#include <optional>
#include <span>
#include <utility>

namespace tamblo {

namespace {

/// One pass over one text.
class Reader {
public:
    Reader(std::string_view text, JsonReadOptions options) noexcept : tokens_(text), options_(options) {}

    std::variant<Value, JsonError> readDocument();

private:
    /// Nothing stands for `null`.
    using Item = std::optional<Value>;
    struct Member {
        std::string_view key;
        std::size_t offset;
        Item item;
    };

    bool readItem(Item& item, int depth);
    bool readArray(Item& item, int depth);
    bool readObject(Item& item, int depth);
    bool readMember(int depth);
    bool buildDictionary(std::span<Member> members, Item& item);
    bool buildDictionarySorted(std::span<Member> members, Item& item);

    JsonTokens tokens_;
    JsonReadOptions options_;
    /// Of the objects that are being read, those of the inner ones on top.
    std::vector<Member> members_;
    /// Objects of one kind, as the elements of an array mostly are, share their keys.
    KeySetCache keySets_;
    std::vector<std::string_view> keys_;
    std::vector<Value> values_;
};

std::variant<Value, JsonError> Reader::readDocument() {
    Item item;
    if (readItem(item, 0) && tokens_.takeEnd() && !item) {
        tokens_.failAt(0, "null is not a value here");
    }
    if (tokens_.error()) {
        return *tokens_.error();
    }
    return *std::move(item);
}

bool Reader::readItem(Item& item, int depth) {
    tokens_.skipSpace();
    switch (tokens_.peek()) {
    case '{':
        return readObject(item, depth + 1);
    case '[':
        return readArray(item, depth + 1);
    case '"': {
        std::string_view text;
        if (!tokens_.takeString(text)) {
            return false;
        }
        item.emplace(text);
        return true;
    }
    case 't':
        item.emplace(true);
        return tokens_.takeLiteral("true");
    case 'f':
        item.emplace(false);
        return tokens_.takeLiteral("false");
    case 'n':
        return options_.refuseNull ? tokens_.fail("null has no place here") : tokens_.takeLiteral("null");
    default:
        return tokens_.takeNumber(item.emplace());
    }
}

bool Reader::readArray(Item& item, int depth) {
    if (!tokens_.takeOpening(depth)) {
        return false;
    }
    Array elements;
    tokens_.skipSpace();
    for (bool isClosed = tokens_.take(']'); !isClosed;) {
        Item element;
        if (!readItem(element, depth) || !tokens_.takeCommaOrClosing(']', isClosed)) {
            return false;
        }
        if (element) {
            elements.push_back(*std::move(element));
        }
    }
    item.emplace(std::move(elements));
    return true;
}

bool Reader::readObject(Item& item, int depth) {
    if (!tokens_.takeOpening(depth)) {
        return false;
    }
    const std::size_t first = members_.size();
    tokens_.skipSpace();
    for (bool isClosed = tokens_.take('}'); !isClosed;) {
        if (!readMember(depth) || !tokens_.takeCommaOrClosing('}', isClosed)) {
            return false;
        }
    }
    const bool isBuilt = buildDictionary(std::span(members_).subspan(first), item);
    members_.resize(first);
    return isBuilt;
}

bool Reader::readMember(int depth) {
    tokens_.skipSpace();
    Member member{{}, tokens_.offset(), {}};
    if (!tokens_.takeKey(member.key) || !readItem(member.item, depth)) {
        return false;
    }
    members_.push_back(std::move(member));
    return true;
}

bool Reader::buildDictionary(std::span<Member> members, Item& item) {
    if (std::any_of(members.begin(), members.end(), [](const Member& member) { return !member.item; })) {
        return buildDictionarySorted(members, item);
    }
    keys_.clear();
    values_.clear();
    for (Member& member : members) {
        keys_.push_back(member.key);
        values_.push_back(*std::move(member.item));
    }
    Dictionary dictionary;
    if (!keys_.empty() &&
        keySets_.makeDictionary(keys_, values_, 0, dictionary) != KeySetCache::Fault::none) {
        return buildDictionarySorted(members, item);
    }
    item.emplace(std::move(dictionary));
    return true;
}

/// For objects with members that are null, or with a key that stands twice.
bool Reader::buildDictionarySorted(std::span<Member> members, Item& item) {
    std::sort(members.begin(), members.end(), [](const Member& a, const Member& b) {
        const int order = a.key.compare(b.key);
        return order != 0 ? order < 0 : a.offset < b.offset;
    });
    const auto twice = std::adjacent_find(members.begin(), members.end(),
                                          [](const Member& a, const Member& b) { return a.key == b.key; });
    if (twice != members.end()) {
        return tokens_.failAt(std::next(twice)->offset,
                              formatted("the key \"{}\" stands here a second time", twice->key));
    }
    std::vector<std::string_view> keys;
    std::vector<Value> values;
    std::vector<std::uint32_t> places;
    for (Member& member : members) {
        if (member.item) {
            places.push_back(static_cast<std::uint32_t>(keys.size()));
            keys.push_back(member.key);
            values.push_back(*std::move(member.item));
        }
    }
    item.emplace(keys.empty() ? Dictionary() : Dictionary::adopt(KeySet::make(keys), values, places));
    return true;
}

} // namespace

std::variant<Value, JsonError> readJson(std::string_view text, JsonReadOptions options) {
    return Reader(text, options).readDocument();
}

} // namespace tamblo
