#include "session/ZRReportingSession.h"

#include "base/Utf8.h"
#include "platform/Counters.h"
#include "util/Log.h"
#include "util/MessageKeys.h"
#include "util/TraceEvents.h"

#include <algorithm>
#include <cstddef>
#include <utility>

namespace tamblo {

std::shared_ptr<ZRReportingSession> ZRReportingSession::initWithID(Context& context, ReporterID reporterID,
                                                                   std::vector<pid_t> processIdentifiers) {
    const WorkerClassLists& classes = workerClassLists();
    auto session =
        std::make_shared<ZRReportingSession>(Created(), context, reporterID, std::move(processIdentifiers));
    session->setServiceType(AudioServiceTypeUnknown);
    session->startWorkersFromClasses(classes.startOnInit);
    log::info(ZRReportingSessionCategory(), "created reporting session for ID: {}", reporterID);
    counters::addAlone(counters::Counter::sessionsCreated);
    emitTracePoint(context, TraceEvent::sessionCreated);
    return session;
}

ZRReportingSession::ZRReportingSession(Created, Context& context, ReporterID reporterID,
                                       std::vector<pid_t> processIdentifiers)
    : context_(context),
      tap_(*context.platform().messageTap),
      audioTags_(context.shared<intake::AudioTags>()),
      normaliser_(context.shared<intake::Normaliser>()),
      reporterID_(reporterID),
      processIdentifiers_(std::move(processIdentifiers)),
      appName_(ZRReportingUtilityRetrieveAppName(configuration_)),
      previousValues_(context.platform().limits.previousKeysOfSession),
      retained_(context.shared<RetainedMessages>(context), *this) {}

ZRReportingSession::~ZRReportingSession() {
    emitTracePoint(context_, TraceEvent::sessionDestroyed);
    log::info(ZRReportingSessionCategory(), "deallocing this session {}", reporterID_);
}

void ZRReportingSession::setServiceType(AudioServiceType serviceType) {
    serviceType_ = serviceType;
    serviceName_ = ZRReportingUtilityGenerateServiceNameFromServiceType(serviceType);
    log::info(ZRReportingSessionCategory(), "setting service type {}", serviceName_);
}

void ZRReportingSession::updateConfigurationWithContentsOfConfiguration(const Dictionary& configuration) {
    configuration_ = configurationWith(configuration);
    configurationBytes_ = heldBytes(configuration_);
    appName_ = ZRReportingUtilityRetrieveAppName(configuration_);
}

Dictionary ZRReportingSession::configurationWith(const Dictionary& configuration) const {
    Dictionary merged = configuration_;
    if (const Value* name = configuration.find(ZRReportingMessageQVHostApplicationDisplayID)) {
        merged.set(ZRReportingApplicationName, *name);
    }
    merged.merge(configuration);
    return merged;
}

void ZRReportingSession::start() {
    recordOwnMessage(AudioEventTypeStart, "start");
    log::info(ZRReportingSessionCategory(), "start called. reporterID={}", reporterID_);
    if (started_) {
        log::info(ZRReportingSessionCategory(), "{} is already started", reporterID_);
        return;
    }
    log::debug(ZRReportingSessionCategory(), "self.started==false. starting. reporterID={}", reporterID_);
    started_ = true;
    startTime_ = context_.platform().clock->now();
    stopTime_.reset();
    counters::addAlone(counters::Counter::sessionsStarted);
    emitTracePoint(context_, TraceEvent::sessionStarted);
    startWorkersFromClasses(workerClassLists().valid);
}

void ZRReportingSession::recordOwnMessage(AudioEventType type, std::string_view method) {
    const std::string suffix = "_at_" + std::string(method);
    const std::size_t count = recordedCount();
    Dictionary payload{
        {"method", method},
        {"messages" + suffix, static_cast<std::int64_t>(count)},
        {"unique_messages" + suffix, static_cast<std::uint64_t>(count)},
        {"reporterid", reporterID_},
        {"running" + suffix, yesOrNo(started_)},
    };
    auto message = std::make_shared<ZRReportingSessionMessage>(std::move(payload), AudioEventKindSetup, type);
    addMissingDates(*message, context_.platform().clock->now());
    addAudioMessageTag(*message, audioTags_);
    const std::size_t bytes = message->payload().bytesOfValues(Dictionary::Shared::inProportion);
    ++ownRecordCount_;
    record(message, bytes, TappedMessage::Origin::session);
}

void ZRReportingSession::record(const MessageRef& message, std::size_t bytesOfValues,
                                TappedMessage::Origin origin) {
    std::size_t bytes = kBytesOfMessage + bytesOfValues;
    messages_.push_back(message);
    try {
        bytes += lastMessages_.add(*message) ? LastMessageIndex::kBytesOfKind : 0;
        blocks_.add(bytes);
    } catch (...) {
        lastMessages_.remove(*message);
        messages_.pop_back();
        throw;
    }
    if (stop_ != nullptr) {
        derivedBytes_ += bytes;
        retained_.addDerived(bytes);
    } else {
        retained_.add(bytes);
    }
    if (tap_.isOpen()) {
        offerToTap(*message, origin);
    }
}

void ZRReportingSession::offerToTap(const ZRReportingSessionMessage& message, TappedMessage::Origin origin) {
    tap_.offer({.reporterID = reporterID_,
                .isSessionStarted = started_,
                .origin = origin,
                .serviceName = serviceName_,
                .category = message.category(),
                .type = message.type(),
                .payload = message.payload(),
                .time = context_.platform().clock->now()});
}

void ZRReportingSession::remember(const Dictionary& payload, std::size_t bytesOfValues, bool isRecorded) {
    const bool wasFull = previousValues_.isFull();
    previousValues_.take(payload, bytesOfValues, isRecorded);
    if (previousValues_.isFull() && !wasFull) {
        counters::addLimit("previous_keys_of_session");
        log::error(ZRReportingSessionCategory(),
                   "more than {} different keys; further ones are not remembered. reporterID={}",
                   context_.platform().limits.previousKeysOfSession, reporterID_);
    }
    // The keys that messages of the list go on to hold are theirs from now on.
    const std::size_t keys = messages_.empty() ? 0 : previousValues_.bytesOfKeysLeft();
    if (keys != 0) {
        blocks_.addToLast(keys);
    }
    const std::size_t before = std::exchange(previousBytes_, previousValues_.heldBytes());
    const std::size_t after = previousBytes_ + keys;
    if (after >= before) {
        retained_.add(after - before);
    } else {
        retained_.remove(before - after);
    }
}

std::size_t ZRReportingSession::letGoOfOldest(std::size_t bytes, std::string_view limit) {
    MessageBlocks::Block freed = blocks_.takeFirst(bytes);
    if (freed.messages != 0) {
        if (droppedMessageCount_ == 0) {
            log::error(ZRReportingSessionCategory(),
                       "{} is reached: the oldest messages of a session are let go. reporterID={} pid={}",
                       limit, reporterID_, processIdentifiers_.empty() ? 0 : processIdentifiers_.front());
        }
        const auto end = messages_.begin() + static_cast<std::ptrdiff_t>(freed.messages);
        std::for_each(messages_.begin(), end,
                      [this](const MessageRef& message) { lastMessages_.remove(*message); });
        messages_.erase(messages_.begin(), end);
        droppedMessageCount_ += freed.messages;
        counters::addAlone(counters::Counter::messagesLostRetained, freed.messages);
        counters::addLimit(limit);
        context_.platform().activity->droppedRecords += freed.messages;
    }
    if (messages_.empty() && freed.bytes < bytes) {
        freed.bytes += std::exchange(previousBytes_, 0);
        previousValues_.clear();
    }
    retained_.remove(freed.bytes);
    return freed.bytes;
}

void ZRReportingSession::sendMessage(const MessageRef& message, ErrorReply reply) {
    const std::shared_ptr<HeldReply> outer = std::exchange(heldReply_, nullptr);
    accept(message);
    if (heldReply_ != nullptr) {
        heldReply_->reply = std::move(reply);
    } else if (reply) {
        reply(nullptr);
    }
    heldReply_ = outer;
}

ZRReportingSession::HeldReply::~HeldReply() {
    if (reply) {
        reply(nullptr);
    }
}

std::shared_ptr<const void> ZRReportingSession::holdReply() {
    if (heldReply_ == nullptr) {
        heldReply_ = std::make_shared<HeldReply>();
    }
    return heldReply_;
}

void ZRReportingSession::accept(const MessageRef& message) {
    ++totalMessageCount_;
    normalise(*message);
    emitTracePoint(context_, TraceEvent::sessionMessage);
    message->isSessionStarted = started_;
    message->isRedundant = messageIsRedundant(*message);
    log::debug(ZRReportingSessionCategory(),
               "ZRReportingSessionWorker action=sendMessage reporterID={} app={} redundant={} message={}",
               reporterID_, appName_, yesOrNo(message->isRedundant), message->payload());
    const std::size_t bytes = message->payload().bytesOfValues(Dictionary::Shared::inProportion);
    messageBytes_ += bytes;
    if (!message->isRedundant) {
        record(message, bytes,
               stop_ != nullptr ? TappedMessage::Origin::derived : TappedMessage::Origin::sent);
        counters::addAlone(counters::Counter::messagesRecorded);
    } else {
        counters::addAlone(counters::Counter::messagesRedundant);
    }
    remember(message->payload(), bytes, !message->isRedundant);
    deliver(message);
}

void ZRReportingSession::normalise(ZRReportingSessionMessage& message) const {
    const Value& tag = audioTags_.of(message.category(), message.type());
    const Clock& clock = *context_.platform().clock;
    message.editPayload([&](Dictionary& payload) { normaliser_.normalise(payload, tag, appName_, clock); });
}

std::vector<std::string> ZRReportingSession::workerNames() const {
    std::vector<std::string> names;
    names.reserve(messageWorkers_.size());
    for (const Worker& worker : messageWorkers_) {
        names.emplace_back(worker.workerClass->name);
    }
    return names;
}

std::string ZRReportingSession::description() const {
    return formatted("{}", *this);
}

void ZRReportingSession::addMissingDates(ZRReportingSessionMessage& message, WallTime now) {
    message.editPayload([now](Dictionary& payload) { intake::addMissingDates(payload, now); });
}

void ZRReportingSession::removeWhiteSpaceFromKeys(ZRReportingSessionMessage& message) {
    message.editPayload(intake::removeWhiteSpaceFromKeys);
}

void ZRReportingSession::addAudioMessageTag(ZRReportingSessionMessage& message, intake::AudioTags& tags) {
    message.editPayload([&](Dictionary& payload) {
        intake::addAudioMessageTag(payload, tags.of(message.category(), message.type()));
    });
}

void ZRReportingSession::addAppName(ZRReportingSessionMessage& message) const {
    message.editPayload([this](Dictionary& payload) { intake::addAppName(payload, appName_); });
}

bool ZRReportingSession::messageIsRedundant(const ZRReportingSessionMessage& message) const {
    // Errors are all kept: of the type, and of the kind without a subsystem. A subsystem's errors are
    // compared.
    if (message.type() == AudioEventTypeError || message.category() == AudioEventKindError) {
        return false;
    }
    const ZRReportingSessionMessage* last = lastMessages_.find(message.category(), message.type());
    if (last == nullptr || !intake::isRepetition(last->payload(), message.payload())) {
        return false;
    }
    log::debug(ZRReportingSessionCategory(), "marking event redundant");
    return true;
}

double ZRReportingSession::getEpochTimeFromZRReportingStateMessage(
    const ZRReportingSessionMessage& message) noexcept {
    return intake::epochTime(message.payload());
}

namespace {

/// A client's choice in a line: what is longer than somebody reads is cut before it is made into text.
struct Shortened {
    const Value& value;
};
void appendText(std::string& out, Shortened name) {
    constexpr std::size_t kMostBytes = 256;
    if (name.value.isString()) {
        out += cutUtf8(name.value.stringValue(), kMostBytes);
    } else if (name.value.heldBytes() <= kMostBytes) {
        appendFormatted(out, "{}", name.value);
    } else {
        out += "(...)";
    }
}

} // namespace

void appendText(std::string& out, const ZRReportingSession& session) {
    const std::vector<pid_t>& owners = session.processIdentifiers();
    const Value appName = ZRReportingUtilityRetrieveAppName(session.configuration());
    appendFormatted(
        out,
        "reporterID={},serviceName={},ownerPid={},clientProcessName={},HostApplicationDisplayID={},"
        "started={},singleMessageSession={}",
        session.reporterID(), session.serviceName(), owners.empty() ? pid_t{0} : owners.front(),
        session.clientProcessName(), Shortened{appName}, session.started(), session.isSingleMessageSession());
}

void appendText(std::string& out, const SessionList& list) {
    out += '[';
    std::string_view separator;
    const auto shown = list.sessions.first(std::min(list.sessions.size(), SessionList::kMost));
    for (const std::shared_ptr<ZRReportingSession>& session : shown) {
        out += separator;
        separator = ", ";
        appendText(out, *session);
    }
    if (shown.size() != list.count) {
        appendFormatted(out, " and {} more", list.count - shown.size());
    }
    out += ']';
}

} // namespace tamblo
