#include "platform/linux/ChanlogChannelJson.h"

#include "base/Dictionary.h"
#include "base/Format.h"

#include <array>
#include <cstdint>
#include <optional>
#include <string_view>
#include <utility>

namespace tamblo {

namespace {

constexpr std::array<std::pair<std::string_view, ChanlogFormat>, 4> kFormats{{
    {"simple", ChanlogFormat::simple},
    {"state", ChanlogFormat::state},
    {"histogram", ChanlogFormat::histogram},
    {"simple_array", ChanlogFormat::simpleArray},
}};

/// Reads the members of one object; stays at the first fault, with which nothing more is read.
class Members {
public:
    Members(const Value& object, std::string& fault) : members_(object.dictionaryValue()), fault_(fault) {
        if (!object.isDictionary()) {
            fail("it", "is no object");
        }
    }

    [[nodiscard]] bool isWell() const noexcept { return fault_.empty(); }
    void fail(std::string_view name, std::string_view what) {
        if (isWell()) {
            fault_ = formatted("{} {}", name, what);
        }
    }

    std::optional<std::string> text(std::string_view name) {
        const Value* value = find(name);
        if (value == nullptr) {
            return std::nullopt;
        }
        if (!value->isString()) {
            fail(name, "is no text");
        } else if (value->stringValue().size() > kMaximumChanlogNameLength) {
            fail(name, formatted("is longer than {} bytes", kMaximumChanlogNameLength));
        }
        return std::string(value->stringValue());
    }
    std::string requiredText(std::string_view name) {
        std::optional<std::string> found = text(name);
        if (!found) {
            fail(name, "is missing");
        }
        return std::move(found).value_or(std::string());
    }
    std::int64_t integer(std::string_view name) {
        const Value* value = find(name);
        if (value == nullptr) {
            fail(name, "is missing");
        } else if (value->kind() != Value::Kind::integer) {
            fail(name, "is no signed 64-bit integer");
        }
        return value != nullptr ? value->integerValue() : 0;
    }
    std::uint64_t count(std::string_view name) {
        const Value* value = find(name);
        if (value == nullptr) {
            fail(name, "is missing");
        } else if (value->kind() != Value::Kind::unsignedInteger &&
                   (value->kind() != Value::Kind::integer || value->rawInteger() < 0)) {
            fail(name, "is no unsigned 64-bit integer");
        }
        return value != nullptr ? value->unsignedValue() : 0;
    }
    std::int64_t signedCount(std::string_view name) {
        const std::int64_t found = integer(name);
        if (found < 0) {
            fail(name, "is negative");
        }
        return found;
    }
    /// Calls `read` with the members of each object in an array.
    template <typename Read> void forEach(std::string_view name, const Read& read) {
        const Value* array = find(name);
        if (array == nullptr || !array->isArray()) {
            return fail(name, array == nullptr ? "is missing" : "is no array");
        }
        const auto elements = array->arrayValue();
        if (elements.size() > kMaximumChanlogElements) {
            return fail(name, formatted("has more than {} elements", kMaximumChanlogElements));
        }
        for (std::size_t i = 0; i < elements.size() && isWell(); ++i) {
            Members members(elements[i], fault_);
            read(members);
            if (!isWell()) {
                fault_ = formatted("{} {}: {}", name, i, fault_);
            }
        }
    }

private:
    [[nodiscard]] const Value* find(std::string_view name) const noexcept {
        return isWell() ? members_.find(name) : nullptr;
    }

    const Dictionary& members_;
    std::string& fault_;
};

ChanlogFormat formatOf(Members& members) {
    const std::string name = members.requiredText("format");
    for (const auto& [known, format] : kFormats) {
        if (name == known) {
            return format;
        }
    }
    members.fail("format", formatted("\"{}\" is not known", name));
    return ChanlogFormat::invalid;
}

void readFigures(Members& members, ChanlogChannel& channel) {
    switch (channel.format) {
    case ChanlogFormat::simple:
        channel.value = members.integer("value");
        break;
    case ChanlogFormat::state:
        members.forEach("states", [&channel](Members& state) {
            channel.states.push_back({.name = state.requiredText("name"),
                                      .transitions = state.count("transitions"),
                                      .residency = state.count("residency")});
        });
        break;
    case ChanlogFormat::histogram:
        members.forEach("buckets", [&channel](Members& bucket) {
            channel.buckets.push_back({.lower = bucket.integer("lower"),
                                       .upper = bucket.integer("upper"),
                                       .hits = bucket.signedCount("hits")});
        });
        channel.minimum = members.integer("min");
        channel.maximum = members.integer("max");
        break;
    case ChanlogFormat::invalid:
    case ChanlogFormat::simpleArray:
        break;
    }
}

} // namespace

std::variant<ChanlogChannel, std::string> readChanlogChannel(const Value& json) {
    std::string fault;
    Members members(json, fault);
    ChanlogChannel channel;
    channel.driverName = members.text("driver");
    channel.groupName = members.text("group");
    channel.subGroupName = members.text("subgroup");
    channel.channelName = members.text("name");
    channel.unitLabel = members.text("unit");
    channel.format = formatOf(members);
    readFigures(members, channel);
    if (!fault.empty()) {
        return fault;
    }
    return channel;
}

} // namespace tamblo
