#pragma once

#include "base/Dictionary.h"
#include "util/AudioEvents.h"

#include <memory>
#include <string>
#include <utility>
#include <vector>

namespace tamblo {

struct WorkerClass;
class ZRReportingSessionMessage;

using MessageRef = std::shared_ptr<ZRReportingSessionMessage>;
using DestinationWorkers = std::vector<const WorkerClass*>;

/// One reported message inside the service: the payload, the category and type that the client gave it, and
/// what the session's intake found. Made with `std::make_shared`, one for each session that receives the
/// message; the session's list and its workers share it, so it lives as long as one of them holds it. A
/// session retains up to millions of them: keep it small.
///
/// Used on the reporting server queue. What another thread is to work with is copied there first: the copy of
/// a payload, or a copied record.
class ZRReportingSessionMessage {
public:
    ZRReportingSessionMessage(Dictionary message, AudioEventCategory category, AudioEventType type) noexcept
        : message_(std::move(message)), category_(category), type_(type) {}
    ZRReportingSessionMessage(const ZRReportingSessionMessage&) = delete;
    ZRReportingSessionMessage& operator=(const ZRReportingSessionMessage&) = delete;

    [[nodiscard]] AudioEventCategory category() const noexcept { return category_; }
    [[nodiscard]] AudioEventType type() const noexcept { return type_; }

    /// A copy of the payload, which later changes do not reach.
    [[nodiscard]] Dictionary message() const noexcept { return message_; }
    /// The payload in place.
    [[nodiscard]] const Dictionary& payload() const noexcept { return message_; }
    /// Changes the payload in place; `edit` is given the dictionary.
    template <typename Edit> void editPayload(Edit&& edit) { edit(message_); }

    /// The only consumer workers that are to see the message; empty for all of them. A copy: what is asked of
    /// each message is `isFor`.
    [[nodiscard]] DestinationWorkers destinationWorkers() const;
    void setDestinationWorkers(DestinationWorkers workers);
    /// Whether a consumer worker of this class is to see it.
    [[nodiscard]] bool isFor(const WorkerClass& workerClass) const noexcept {
        return destinationWorkers_ == nullptr || namesDestination(workerClass);
    }

    /// Another record with the same payload, category, type and flags. It goes to every consumer worker,
    /// whatever destinations this one has.
    [[nodiscard]] MessageRef copyWithZone() const;
    [[nodiscard]] std::string description() const;

    /// Sorts by epoch time, stably; a time that is not a number counts as 0. Whether the order changed.
    static bool sortMessages(std::vector<MessageRef>& messages);

private:
    [[nodiscard]] bool namesDestination(const WorkerClass& workerClass) const noexcept;

    Dictionary message_;
    std::unique_ptr<const DestinationWorkers> destinationWorkers_;
    const AudioEventCategory category_;
    const AudioEventType type_;

public:
    /// Repeats the last accepted message of its category and type.
    bool isRedundant : 1 = false;
    /// The session had been started when the message came.
    bool isSessionStarted : 1 = false;
};

static_assert(sizeof(ZRReportingSessionMessage) == 24, "a million of them are retained");

void appendText(std::string& out, const ZRReportingSessionMessage& message);

} // namespace tamblo
