#include "Attacks.h"

#include <array>
#include <memory>
#include <string>
#include <vector>

namespace tamblo::bench {

namespace {

using wire::Method;

constexpr std::int64_t kReporterID = 100;
constexpr std::uint16_t kTestService = 11;
constexpr std::size_t kBytesPerSend = 64U << 10U;

bool sendIfMany(HostileClient& client) {
    return client.waitingBytes() < kBytesPerSend || client.send();
}

/// Makes as many sessions, unless the time is over before.
void makeSessions(HostileClient& client, std::int64_t count, bool isStarted) {
    for (std::int64_t id = 1; id <= count; ++id) {
        if (isStarted) {
            addSession(client, id);
        } else {
            client.add({.method = Method::createReportingSession, .reporterID = id});
        }
        if (!sendIfMany(client)) {
            return;
        }
    }
    client.settle();
}

/// Sends a message each of these kinds to a session that writes a summary file at its stop; the numbers are
/// multiples of a size that tables of that many entries have.
void collidingKinds(const Assault& assault) {
    constexpr std::uint64_t kTableSize = 172'933;
    HostileClient client(assault);
    addSession(client, kReporterID, kTestService);
    for (std::uint64_t i = 1; i <= 110'000; ++i) {
        const std::uint64_t number = i * kTableSize;
        wire::Request message = messageFor(kReporterID, {});
        message.category = static_cast<std::uint32_t>(number >> 16U);
        message.type = static_cast<std::uint16_t>(number);
        client.add(message);
        if (!sendIfMany(client)) {
            return;
        }
    }
    client.settle();
    client.add({.method = Method::stopReportingSessionForID, .reporterID = kReporterID});
    client.settle();
    assault.sleepUntilOver();
}

void manySessionsListed(const Assault& assault) {
    HostileClient client(assault);
    makeSessions(client, 300'000, false);
    const wire::Request list{.method = Method::getAllReporters};
    do {
        for (int i = 0; i < 1'000; ++i) {
            client.add(list);
        }
    } while (client.send());
    assault.sleepUntilOver();
}

void broadcasts(const Assault& assault) {
    HostileClient client(assault);
    makeSessions(client, 10'000, true);
    wire::Request message = messageFor(0, {});
    message.reporterIDs.clear();
    for (int number = 0;; ++number) {
        message.dictionary = Dictionary{{"count", number}};
        client.add(message);
        if (!client.send()) {
            return;
        }
    }
}

void longApplicationName(const Assault& assault) {
    HostileClient client(assault);
    addSession(client, kReporterID);
    client.add({.method = Method::setConfiguration,
                .reporterID = kReporterID,
                .dictionary = Dictionary{{"HostApplicationDisplayID", std::string(1'000'000, 'x')}}});
    do {
        for (int number = 0; number < 300; ++number) {
            client.add(messageFor(kReporterID, {{"count", number}}));
        }
    } while (client.settle());
}

void summaryFiles(const Assault& assault) {
    HostileClient client(assault);
    for (int number = 0;; ++number) {
        addSession(client, kReporterID, kTestService);
        client.add(messageFor(kReporterID, {{"count", number}}));
        client.add({.method = Method::stopReportingSessionForID, .reporterID = kReporterID});
        if (!sendIfMany(client)) {
            return;
        }
    }
}

void startsAndStops(const Assault& assault) {
    HostileClient client(assault);
    addSession(client, kReporterID);
    for (;;) {
        client.add({.method = Method::startReportingSessionForID, .reporterID = kReporterID});
        client.add({.method = Method::stopReportingSessionForID, .reporterID = kReporterID});
        if (!sendIfMany(client)) {
            return;
        }
    }
}

void growingConfiguration(const Assault& assault) {
    HostileClient client(assault);
    addSession(client, kReporterID);
    for (int number = 0;; ++number) {
        client.add({.method = Method::setConfiguration,
                    .reporterID = kReporterID,
                    .dictionary = Dictionary{{"key " + std::to_string(number), std::string(100, 'x')}}});
        if (!sendIfMany(client)) {
            return;
        }
    }
}

/// Each change makes the session anew, with all that it was configured with and has seen.
void changingServiceType(const Assault& assault) {
    HostileClient client(assault);
    addSession(client, kReporterID);
    Dictionary entries;
    for (int key = 0; key < 1'000; ++key) {
        entries.set("a key of some length, number " + std::to_string(key), key);
    }
    client.add({.method = Method::setConfiguration, .reporterID = kReporterID, .dictionary = entries});
    client.add(messageFor(kReporterID, entries));
    for (int number = 0;; ++number) {
        client.add({.method = Method::setServiceType,
                    .reporterID = kReporterID,
                    .serviceType = static_cast<std::uint16_t>(number % 8)});
        if (!sendIfMany(client)) {
            return;
        }
    }
}

void startedSessionsDestroyed(const Assault& assault) {
    constexpr std::int64_t kSessions = 10'000;
    HostileClient client(assault);
    do {
        makeSessions(client, kSessions, true);
        for (std::int64_t id = 1; id <= kSessions; ++id) {
            client.add({.method = Method::destroyReportingSession, .reporterID = id});
        }
    } while (client.settle());
}

/// A client that is done with a session of many messages and stays.
void largeSessionStopped(const Assault& assault) {
    HostileClient client(assault);
    addSession(client, kReporterID);
    for (int number = 0; number < 200'000; ++number) {
        client.add(messageFor(kReporterID, {{"count", number},
                                            {"QVSessionVolume", 0.01 * (number % 100)},
                                            {"audio_route", "headphones-wireless"},
                                            {"session_input_running", number % 2 == 0}}));
        if (!sendIfMany(client)) {
            return;
        }
    }
    client.settle();
    assault.noteResidentBytes();
    client.add({.method = Method::stopReportingSessionForID, .reporterID = kReporterID});
    client.settle();
    assault.sleepUntilOver();
}

void neverStarted(const Assault& assault) {
    HostileClient client(assault);
    client.add({.method = Method::createReportingSession, .reporterID = kReporterID});
    for (int number = 0;; ++number) {
        client.add(messageFor(kReporterID, {{"count", number}, {"text", std::string(1'000, 'x')}}));
        if (!sendIfMany(client)) {
            return;
        }
    }
}

/// Each connection has one message to all under way.
void broadcastsOfMany(const Assault& assault) {
    HostileClient first(assault), second(assault);
    makeSessions(first, 8'000, true);
    makeSessions(second, 8'000, true);
    wire::Request message = messageFor(0, {});
    message.reporterIDs.clear();
    std::vector<std::unique_ptr<HostileClient>> clients;
    while (clients.size() < 1'000 && !assault.isOver()) {
        clients.push_back(std::make_unique<HostileClient>(assault));
        message.dictionary = Dictionary{{"count", std::int64_t(clients.size())}};
        clients.back()->add(message);
        clients.back()->send();
    }
    assault.sleepUntilOver();
}

/// Each message ends a stretch of what is derived at the stop.
void shortStretches(const Assault& assault) {
    HostileClient client(assault);
    addSession(client, kReporterID);
    for (int number = 0; number < 200'000; ++number) {
        client.add(messageFor(kReporterID, {{"zrreporting_timestamp", 2e9 + 2 * number},
                                            {"active_devices", std::to_string(number)},
                                            {"session_running", true}}));
        if (!sendIfMany(client)) {
            return;
        }
    }
    client.add({.method = Method::stopReportingSessionForID, .reporterID = kReporterID});
    client.settle();
    assault.sleepUntilOver();
}

/// Sessions whose client is gone before they are stopped.
void sessionsLeft(const Assault& assault) {
    while (!assault.isOver()) {
        HostileClient client(assault);
        for (std::int64_t id = 1; id <= 3'000 && !assault.isOver(); ++id) {
            addSession(client, id);
            client.add(messageFor(id, {{"count", id}}));
        }
        client.settle();
    }
}

void largeSessionDestroyed(const Assault& assault) {
    HostileClient client(assault);
    do {
        client.add({.method = Method::createReportingSession, .reporterID = kReporterID});
        for (int number = 0; number < 100'000; ++number) {
            client.add(messageFor(kReporterID, {{"count", number}}));
            if (!sendIfMany(client)) {
                return;
            }
        }
        client.add({.method = Method::destroyReportingSession, .reporterID = kReporterID});
    } while (client.settle());
}

/// Every list is read, and asked for again.
void listsRead(const Assault& assault) {
    HostileClient client(assault);
    makeSessions(client, 1'000, false);
    do {
        for (int i = 0; i < 850; ++i) {
            client.addCall({.method = Method::getAllReporters});
        }
    } while (client.settle());
}

constexpr std::array kAttacks{
    Attack{"colliding_kinds", "110,000 messages of kinds that collide, then the summary file of them",
           collidingKinds},
    Attack{"many_sessions", "300,000 sessions, then lists of them that nobody awaits", manySessionsListed},
    Attack{"broadcast", "messages to 10,000 started sessions each", broadcasts},
    Attack{"application_name", "a name of 1 MB, then small messages", longApplicationName},
    Attack{"summary_files", "sessions with a summary file, started and stopped", summaryFiles},
    Attack{"starts_and_stops", "a session started and stopped", startsAndStops},
    Attack{"growing_configuration", "each configuration brings a new key", growingConfiguration},
    Attack{"changing_service_type", "the type of a session with 1,000 keys changed", changingServiceType},
    Attack{"sessions_destroyed", "10,000 started sessions destroyed at once", startedSessionsDestroyed},
    Attack{"large_session", "a session of 200,000 messages stopped", largeSessionStopped, Shortage::none,
           std::chrono::seconds(10)},
    Attack{"never_started", "messages to a session that is never started", neverStarted},
    Attack{"broadcasts_of_many", "a message to 16,000 started sessions of each of 1,000 clients",
           broadcastsOfMany},
    Attack{"short_stretches", "a session of 200,000 stretches stopped", shortStretches},
    Attack{"sessions_left", "3,000 started sessions of a client that goes", sessionsLeft},
    Attack{"large_session_destroyed", "100,000 messages, destroyed without a start", largeSessionDestroyed},
    Attack{"lists_read", "850 lists of 1,000 reporters asked for at once, and read", listsRead},
};

} // namespace

std::span<const Attack> attacksBySession() noexcept {
    return kAttacks;
}

} // namespace tamblo::bench
