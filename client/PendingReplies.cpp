#include "client/PendingReplies.h"

namespace tamblo::client {

Error makeError(ErrorCode code) {
    constexpr std::string_view messages[] = {
        "the connection to the service was lost before it answered",
        "not sent: the queue is full, or the message is longer than the service accepts",
        "the client was closed before the service answered",
        "the service answered with another kind of result",
        "too many requests are unanswered",
    };
    const auto number = static_cast<std::int64_t>(code);
    return {std::string(kErrorDomain), number, std::string(messages[number - 1])};
}

std::optional<std::uint64_t> PendingReplies::reserve() {
    if (firstFree_ == kNone) {
        if (entries_.size() == kMaximumEntries) {
            return std::nullopt;
        }
        entries_.emplace_back();
        firstFree_ = static_cast<std::uint32_t>(entries_.size() - 1);
    }
    const std::uint32_t index = firstFree_;
    Entry& entry = entries_[index];
    firstFree_ = entry.nextFree;
    entry.id = ++lastNumber_ << kIndexBits | index;
    return entry.id;
}

void PendingReplies::expect(std::uint64_t id, ReplyFunction reply, bool everyReply) noexcept {
    Entry& entry = entries_[indexOf(id)];
    entry.reply = std::move(reply);
    entry.everyReply = everyReply;
}

void PendingReplies::cancel(std::uint64_t id) noexcept {
    free(indexOf(id));
}

bool PendingReplies::deliver(std::uint64_t id, const ReplyView& reply) {
    const std::size_t index = indexOf(id);
    if (index >= entries_.size() || entries_[index].id != id || !entries_[index].reply) {
        return false;
    }
    Entry& entry = entries_[index];
    entry.reply(reply);
    if (!entry.everyReply) {
        free(index);
    }
    return true;
}

void PendingReplies::failAll(const Error& error) {
    const ReplyView reply{.error = &error};
    for (std::size_t index = 0; index < entries_.size(); ++index) {
        if (entries_[index].reply) {
            entries_[index].everyReply = false;
            deliver(entries_[index].id, reply);
        }
    }
}

void PendingReplies::free(std::size_t index) noexcept {
    Entry& entry = entries_[index];
    entry.reply.reset();
    entry.id = 0;
    entry.nextFree = firstFree_;
    firstFree_ = static_cast<std::uint32_t>(index);
}

} // namespace tamblo::client
