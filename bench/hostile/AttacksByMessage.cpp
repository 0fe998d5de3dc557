#include "Attacks.h"
#include "Bystander.h"

#include <array>
#include <string>

namespace tamblo::bench {

namespace {

constexpr std::int64_t kReporterID = 100; // two bytes on the wire
constexpr std::size_t kLarge = 900'000;
constexpr std::size_t kBytesPerSend = 64U << 10U;

/// One message after the other, as fast as they are taken.
template <typename Make> void flood(HostileClient& client, Make&& make) {
    for (std::uint64_t number = 0;; ++number) {
        client.add(make(number));
        if (client.waitingBytes() >= kBytesPerSend && !client.send()) {
            return;
        }
    }
}

/// Of an error, which counts as no repetition, for so many times the same reporter.
void writeMessage(CborWriter& writer, const Dictionary& payload, std::size_t reporters,
                  std::uint64_t reporterID) {
    constexpr std::uint64_t kPlayback = 4, kError = 6;
    writer.dictionary(payload);
    writer.unsignedInteger(kPlayback);
    writer.unsignedInteger(kError);
    writer.arrayHead(reporters);
    for (std::size_t i = 0; i < reporters; ++i) {
        writer.unsignedInteger(reporterID);
    }
}

void manyKeys(const Assault& assault) {
    HostileClient client(assault);
    addSession(client, kReporterID);
    flood(client, [](std::uint64_t number) {
        return messageFor(kReporterID, {{"key of " + std::to_string(number), 1}});
    });
}

/// The largest frame's worth of keys, then messages that are merged into what it left.
void hundredThousandKeys(const Assault& assault) {
    constexpr std::uint64_t kKeys = 100'000;
    HostileClient client(assault);
    addSession(client, kReporterID);
    client.addRaw(wire::Method::sendMessage, [](CborWriter& writer) {
        writer.mapHead(kKeys);
        for (std::uint64_t key = 0; key < kKeys; ++key) {
            writer.text(std::to_string(1'000'000 + key));
            writer.boolean(true);
        }
        writer.unsignedInteger(4);
        writer.unsignedInteger(1);
        writer.arrayHead(1);
        writer.integer(kReporterID);
    });
    flood(client, [](std::uint64_t number) {
        return messageFor(kReporterID, {{"count", number}, {"text", std::string(60, 'x')}});
    });
}

void repeatedIdentifier(const Assault& assault) {
    const Dictionary payload{{"text", std::string(10'000, 'x')}};
    HostileClient client(assault);
    addSession(client, kReporterID);
    do {
        client.addRaw(wire::Method::sendMessage,
                      [&](CborWriter& writer) { writeMessage(writer, payload, 10'000, kReporterID); });
    } while (client.settle());
}

void unknownIdentifiers(const Assault& assault) {
    HostileClient client(assault);
    do {
        client.addRaw(wire::Method::sendMessage,
                      [](CborWriter& writer) { writeMessage(writer, {}, 200'000, 5); });
    } while (client.settle());
}

void floodWith(const Assault& assault, const std::string& text) {
    HostileClient client(assault);
    addSession(client, kReporterID);
    flood(client, [&](std::uint64_t number) {
        return messageFor(kReporterID, {{"count", number}, {"text", text}});
    });
}

void largeMessages(const Assault& assault) {
    floodWith(assault, std::string(kLarge, 'x'));
}

/// Six bytes each in a line of a sink.
void largeEscapedMessages(const Assault& assault) {
    floodWith(assault, std::string(kLarge, '\x01'));
}

/// Each a byte on the wire, and a value in memory.
void emptyArrays(const Assault& assault) {
    HostileClient client(assault);
    addSession(client, kReporterID);
    do {
        for (int frame = 0; frame < 8; ++frame) {
            client.addRaw(wire::Method::sendMessage, [](CborWriter& writer) {
                writer.mapHead(1);
                writer.text("arrays");
                writer.arrayHead(kLarge);
                for (std::size_t i = 0; i < kLarge; ++i) {
                    writer.arrayHead(0);
                }
                writer.unsignedInteger(4);
                writer.unsignedInteger(1);
                writer.arrayHead(1);
                writer.integer(kReporterID);
            });
        }
    } while (client.settle());
}

/// Few keys, and what stands last under each of them is as long as a frame takes.
void largeValuesUnderNewKeys(const Assault& assault) {
    HostileClient client(assault);
    addSession(client, kReporterID);
    const std::string text(kLarge, 'x');
    flood(client, [&](std::uint64_t number) {
        return messageFor(kReporterID, {{"key " + std::to_string(number), text}});
    });
}

/// Messages with two keys each that no other has, retained in some sessions; then the client goes.
void distinctKeysThatAreGone(const Assault& assault) {
    constexpr int kMessagesOfSession = 500;
    HostileClient client(assault);
    for (int number = 0; number < 12'000; ++number) {
        const std::int64_t reporterID = kReporterID + number / kMessagesOfSession;
        if (number % kMessagesOfSession == 0) {
            addSession(client, reporterID);
        }
        const std::string suffix = std::to_string(number);
        client.add(messageFor(reporterID, {{"key " + suffix, number}, {"other " + suffix, 1}}));
        if (client.waitingBytes() >= kBytesPerSend && !client.send()) {
            return;
        }
    }
    client.settle();
    client.close();
    assault.sleepUntilOver();
}

/// As many entries as honest messages have at most, each time with other values.
void wideMessages(const Assault& assault) {
    Dictionary payload;
    std::vector<std::string> keys;
    for (int key = 0; key < 500; ++key) {
        keys.push_back("an entry of a wide message, number " + std::to_string(key));
    }
    HostileClient client(assault);
    addSession(client, kReporterID);
    flood(client, [&](std::uint64_t number) {
        for (const std::string& key : keys) {
            payload.set(key, number);
        }
        return messageFor(kReporterID, payload);
    });
}

/// By turns the same two: compared over their whole length, and never equal.
void almostRepeated(const Assault& assault) {
    HostileClient client(assault);
    addSession(client, kReporterID);
    const std::array texts{std::string(60'000, 'x') + "1", std::string(60'000, 'x') + "2"};
    flood(client, [&](std::uint64_t number) {
        return messageFor(kReporterID, {{"text", texts[number % 2]}});
    });
}

void toForeignSession(const Assault& assault) {
    HostileClient client(assault);
    flood(client, [](std::uint64_t number) {
        return messageFor(Bystander::kReporterID, {{"count", number}, {"text", std::string(2'000, 'x')}});
    });
}

void manyKinds(const Assault& assault) {
    HostileClient client(assault);
    addSession(client, kReporterID);
    flood(client, [](std::uint64_t number) {
        wire::Request message = messageFor(kReporterID, {{"count", number}});
        message.category = static_cast<std::uint32_t>(number >> 4U) + 1'000;
        message.type = static_cast<std::uint16_t>(number * 4'099);
        return message;
    });
}

/// The longest list of reporters that is not refused, each a delivery.
void longLists(const Assault& assault) {
    HostileClient client(assault);
    addSession(client, kReporterID);
    const Dictionary payload{{"text", std::string(10'000, 'x')}};
    do {
        client.addRaw(wire::Method::sendMessage,
                      [&](CborWriter& writer) { writeMessage(writer, payload, 128, kReporterID); });
    } while (client.send());
}

constexpr std::array kAttacks{
    Attack{"many_keys", "each message brings a new key", manyKeys},
    Attack{"keys_100k", "a frame with 100,000 keys, then small messages", hundredThousandKeys},
    Attack{"repeated_identifier", "a reporter named 10,000 times in a frame", repeatedIdentifier},
    Attack{"long_lists", "a reporter named 128 times in a frame", longLists},
    Attack{"unknown_identifiers", "200,000 unknown reporters in a frame", unknownIdentifiers},
    Attack{"large_messages", "messages of 0.9 MB", largeMessages},
    Attack{"escaped_messages", "messages of 0.9 MB that takes six times as much in a line",
           largeEscapedMessages},
    Attack{"empty_arrays", "900,000 empty arrays in a frame, eight frames at once", emptyArrays},
    Attack{"large_values", "0.9 MB under a new key in each message", largeValuesUnderNewKeys},
    Attack{"distinct_keys_gone", "12,000 messages with keys of their own, then the end of their client",
           distinctKeysThatAreGone},
    Attack{"wide_messages", "messages of 500 entries", wideMessages},
    Attack{"almost_repeated", "messages that differ in the last byte of 60,000", almostRepeated},
    Attack{"foreign_session", "messages to the other user's session", toForeignSession},
    Attack{"many_kinds", "each message has a category and type of its own", manyKinds},
};

} // namespace

std::span<const Attack> attacksByMessage() noexcept {
    return kAttacks;
}

} // namespace tamblo::bench
