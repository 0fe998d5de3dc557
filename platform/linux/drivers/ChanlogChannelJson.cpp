#include "platform/linux/drivers/ChanlogChannelJson.h"

#include "base/Format.h"

#include <array>
#include <cmath>
#include <cstdint>
#include <limits>
#include <memory>
#include <optional>
#include <string_view>
#include <utility>
#include <vector>

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
    Members(const JsonItem& object, std::string& fault) : object_(object), fault_(fault) {
        if (object.kind != JsonItem::Kind::object) {
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
        const JsonItem* item = find(name);
        if (item == nullptr) {
            return std::nullopt;
        }
        if (item->kind != JsonItem::Kind::text) {
            fail(name, "is no text");
        } else if (item->text.size() > kMaximumChanlogNameLength) {
            fail(name, formatted("is longer than {} bytes", kMaximumChanlogNameLength));
        }
        return std::string(item->text);
    }
    std::string requiredText(std::string_view name) {
        std::optional<std::string> found = text(name);
        if (!found) {
            fail(name, "is missing");
        }
        return std::move(found).value_or(std::string());
    }
    std::int64_t integer(std::string_view name) {
        return wholeNumber<std::int64_t>(name, "is no signed 64-bit integer");
    }
    std::uint64_t count(std::string_view name) {
        return wholeNumber<std::uint64_t>(name, "is no unsigned 64-bit integer");
    }
    std::int64_t signedCount(std::string_view name) {
        const std::int64_t found = integer(name);
        if (found < 0) {
            fail(name, "is negative");
        }
        return found;
    }
    /// What `read` makes of the members of each object in an array.
    template <typename Element, typename Read>
    void list(std::string_view name, std::vector<Element>& elements, const Read& read) {
        const JsonItem* array = find(name);
        if (array == nullptr || array->kind != JsonItem::Kind::array) {
            return fail(name, array == nullptr ? "is missing" : "is no array");
        }
        std::size_t count = 0;
        for (const JsonItem* item = array->first(); item != array->end(); item = item->next()) {
            count += item->kind != JsonItem::Kind::null ? 1 : 0;
        }
        if (count > kMaximumChanlogElements) {
            return fail(name, formatted("has more than {} elements", kMaximumChanlogElements));
        }
        elements.reserve(count);
        for (const JsonItem* item = array->first(); item != array->end() && isWell(); item = item->next()) {
            if (item->kind == JsonItem::Kind::null) {
                continue;
            }
            Members members(*item, fault_);
            elements.push_back(read(members));
            if (!isWell()) {
                fault_ = formatted("{} {}: {}", name, elements.size() - 1, fault_);
            }
        }
    }

private:
    /// Also of a number with a fraction of zero, as it comes out of languages that have one kind of number.
    template <typename Number> Number wholeNumber(std::string_view name, std::string_view otherwise) {
        using Range = std::numeric_limits<Number>;
        const Value& number = scalar(name);
        switch (number.kind()) {
        case Value::Kind::integer:
            if (std::in_range<Number>(number.rawInteger())) {
                return static_cast<Number>(number.rawInteger());
            }
            break;
        case Value::Kind::unsignedInteger:
            if (std::in_range<Number>(number.unsignedValue())) {
                return static_cast<Number>(number.unsignedValue());
            }
            break;
        case Value::Kind::doubleFloat: {
            // The greatest number is no double, the one behind it is.
            const double exact = number.doubleValue();
            if (std::trunc(exact) == exact && exact >= static_cast<double>(Range::min()) &&
                exact < std::ldexp(1.0, Range::digits)) {
                return static_cast<Number>(exact);
            }
            break;
        }
        default:
            break;
        }
        fail(name, otherwise);
        return 0;
    }
    const JsonItem* find(std::string_view name) const noexcept {
        return isWell() ? object_.find(name) : nullptr;
    }
    /// The boolean false, which is no number of any kind, when there is none.
    const Value& scalar(std::string_view name) {
        static const Value none;
        const JsonItem* item = find(name);
        if (item == nullptr) {
            fail(name, "is missing");
        }
        return item != nullptr ? item->scalar : none;
    }

    const JsonItem& object_;
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
        members.list("states", channel.states, [](Members& state) {
            return ChanlogState{.name = state.requiredText("name"),
                                .transitions = state.count("transitions"),
                                .residency = state.count("residency")};
        });
        break;
    case ChanlogFormat::histogram:
        members.list("buckets", channel.buckets, [](Members& bucket) {
            return ChanlogBucket{.lower = bucket.integer("lower"),
                                 .upper = bucket.integer("upper"),
                                 .hits = bucket.signedCount("hits")};
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

std::variant<ChanlogChannelRef, std::string> readChanlogChannel(const JsonItem& json) {
    std::string fault;
    Members members(json, fault);
    auto channel = std::make_shared<ChanlogChannel>();
    channel->driverName = members.text("driver");
    channel->groupName = members.text("group");
    channel->subGroupName = members.text("subgroup");
    channel->channelName = members.text("name");
    channel->unitLabel = members.text("unit");
    channel->format = formatOf(members);
    readFigures(members, *channel);
    if (!fault.empty()) {
        return fault;
    }
    return channel;
}

} // namespace tamblo
