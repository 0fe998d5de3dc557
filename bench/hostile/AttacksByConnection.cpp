#include "Attacks.h"

#include <array>
#include <memory>
#include <string>
#include <thread>
#include <vector>

namespace tamblo::bench {

namespace {

using wire::Method;

constexpr std::int64_t kReporterID = 100;
constexpr std::size_t kBytesPerSend = 16U << 10U;

std::vector<std::unique_ptr<HostileClient>>
connect(const Assault& assault, std::size_t count,
        HostileClient::Replies replies = HostileClient::Replies::read) {
    std::vector<std::unique_ptr<HostileClient>> clients;
    while (clients.size() < count && !assault.isOver()) {
        clients.push_back(std::make_unique<HostileClient>(assault, replies));
    }
    return clients;
}

/// All but the last byte of the longest frame, on each.
void unfinishedFrames(const Assault& assault) {
    std::string frame("\0\0\x10\0", 4);
    frame.resize(wire::kMaximumFrameBytes + 3, 'x');
    const auto clients = connect(assault, 200);
    for (const auto& client : clients) {
        client->addBytes(frame);
        client->send();
    }
    assault.sleepUntilOver();
}

void idleConnections(const Assault& assault) {
    const auto idle = connect(assault, 300);
    HostileClient client(assault);
    wire::Request message = messageFor(0, {});
    message.reporterIDs.clear();
    for (int number = 0; number < 100'000; number += 200) {
        for (int i = 0; i < 200; ++i) {
            message.dictionary = Dictionary{{"count", number + i}};
            client.add(message);
        }
        if (!client.settle()) {
            return;
        }
    }
}

/// Holds all connections that there are, and tries for more.
void descriptors(const Assault& assault) {
    const auto clients = connect(assault, 100);
    while (!assault.isOver()) {
        for (const auto& client : clients) {
            client->addCall({.method = Method::reporterID, .reporterID = 1});
            if (!client->send()) {
                client->reconnect();
            }
        }
        std::this_thread::sleep_for(std::chrono::milliseconds(10));
    }
}

/// Each leaves a started session behind, whose stop is work for a thread.
void connectionsWithoutThreads(const Assault& assault) {
    while (!assault.isOver()) {
        HostileClient client(assault);
        addSession(client, kReporterID);
        client.settle();
    }
}

void connectionsInALoop(const Assault& assault) {
    while (!assault.isOver()) {
        const auto clients = connect(assault, 50);
    }
}

void neverReading(const Assault& assault) {
    HostileClient owner(assault);
    for (std::int64_t id = 1; id <= 1'000; ++id) {
        owner.add({.method = Method::createReportingSession, .reporterID = 1'000'000'000'000 + id});
    }
    owner.settle();
    const auto clients = connect(assault, 50, HostileClient::Replies::left);
    while (!assault.isOver()) {
        for (const auto& client : clients) {
            if (!client->isOpen()) {
                client->reconnect();
            }
            for (int i = 0; client->waitingBytes() < kBytesPerSend && i < 100; ++i) {
                client->addCall({.method = Method::getAllReporters});
            }
            client->sendWhatFits();
        }
    }
}

void unknownMethods(const Assault& assault) {
    HostileClient client(assault);
    std::string frames;
    for (int i = 0; i < 1'000; ++i) {
        frames += std::string("\x09\0\0\0\x83\x02\x65other\x80", 13);
        frames += std::string("\x08\0\0\0\x84\0\x01\x63xyz\x80", 12);
    }
    do {
        client.addBytes(frames);
    } while (client.send());
}

void smallestFrames(const Assault& assault) {
    HostileClient client(assault);
    std::string frames;
    for (int i = 0; i < 10'000; ++i) {
        frames += std::string("\x01\0\0\0\x07", 5);
    }
    do {
        client.addBytes(frames);
    } while (client.send());
}

void frameThatIsNone(const Assault& assault) {
    while (!assault.isOver()) {
        HostileClient client(assault);
        client.addBytes(std::string("\x01\0\0\0\x1C", 5));
        client.send();
    }
}

/// The kernel's whole buffer for each, filled again as soon as it is read.
void manySenders(const Assault& assault) {
    const auto clients = connect(assault, 500);
    for (const auto& client : clients) {
        client->add({.method = Method::createReportingSession, .reporterID = kReporterID});
        client->send();
    }
    for (int number = 0; !assault.isOver(); ++number) {
        for (const auto& client : clients) {
            for (int i = 0; client->waitingBytes() < kBytesPerSend && i < 200; ++i) {
                client->add(messageFor(kReporterID, {{"count", 1'000 * number + i}}));
            }
            client->sendWhatFits();
        }
    }
}

void killService(const Assault& assault) {
    while (!assault.isOver()) {
        HostileClient client(assault);
        client.addCall({.method = Method::killService});
        client.send();
        std::this_thread::sleep_for(std::chrono::milliseconds(100));
    }
}

constexpr std::array kAttacks{
    Attack{"unfinished_frames", "200 connections with all but the end of a frame", unfinishedFrames},
    Attack{"idle_connections", "broadcasts, with 300 idle connections", idleConnections},
    Attack{"descriptors", "all descriptors taken by connections, and a sink's file moved away", descriptors,
           Shortage::descriptors},
    Attack{"no_threads", "connections made and ended when no thread can be had", connectionsWithoutThreads,
           Shortage::threads},
    Attack{"connections", "connections made and ended", connectionsInALoop},
    Attack{"never_reading", "50 clients that do not read the lists that they ask for", neverReading},
    Attack{"unknown_methods", "small frames that are refused", unknownMethods},
    Attack{"smallest_frames", "frames of five bytes that are refused", smallestFrames},
    Attack{"no_frames", "connections that end with a frame that is none", frameThatIsNone},
    Attack{"many_senders", "500 connections that send as fast as they can", manySenders},
    Attack{"kill_service", "the request to end", killService},
};

} // namespace

std::span<const Attack> attacksByConnection() noexcept {
    return kAttacks;
}

} // namespace tamblo::bench
