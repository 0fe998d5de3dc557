#include "CrashClient.h"

#include "base/TextBuffer.h"
#include "os/FileDescriptor.h"
#include "os/LocalAddress.h"
#include "wire/FrameSplitter.h"
#include "wire/Reply.h"
#include "wire/Request.h"

#include <chrono>
#include <cstdio>
#include <cstdlib>
#include <deque>

#include <sys/socket.h>

namespace tamblo::bench {

namespace {

using wire::Method;

constexpr std::size_t kMostUnderWay = 48;
/// As long as this most messages' texts, one in eight of them up to a hundred times that.
constexpr std::size_t kUsualText = 300;

FileDescriptor connectTo(const std::string& path) {
    FileDescriptor socket(::socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0));
    const auto address = LocalAddress::of(path);
    if (!address || ::connect(socket.get(), address->get(), address->size()) != 0) {
        socket.reset();
    }
    return socket;
}

bool sendAll(int socket, std::string_view bytes) {
    while (!bytes.empty()) {
        const ssize_t count = ::send(socket, bytes.data(), bytes.size(), MSG_NOSIGNAL);
        if (count <= 0) {
            return false;
        }
        bytes.remove_prefix(static_cast<std::size_t>(count));
    }
    return true;
}

} // namespace

CrashClient::CrashClient(std::size_t client, std::string socketPath, Ledger& ledger,
                         const CrashControl& control, unsigned seed)
    : client_(client),
      socketPath_(std::move(socketPath)),
      ledger_(ledger),
      control_(control),
      random_(seed),
      thread_([this] { run(); }) {}

void CrashClient::run() {
    while (!control_.isOver) {
        if (const FileDescriptor socket = connectTo(socketPath_); socket.isOpen()) {
            write(socket.get());
        }
        std::this_thread::sleep_for(std::chrono::milliseconds(1));
    }
}

void CrashClient::write(int socket) {
    struct UnderWay {
        std::uint64_t number;
        std::uint64_t roomChanges;
    };
    const auto reporterID = static_cast<std::int64_t>(client_ + 1);
    const std::string name = "client-" + std::to_string(client_);
    TextBuffer outgoing, incoming;
    const auto add = [&outgoing](const wire::Request& request) {
        (void)wire::appendRequestFrame(outgoing, request);
    };
    add({.method = Method::createReportingSession, .reporterID = reporterID});
    add({.method = Method::setConfiguration,
         .reporterID = reporterID,
         .dictionary = Dictionary{{"HostApplicationDisplayID", name}}});
    add({.method = Method::startReportingSessionForID, .reporterID = reporterID});

    std::deque<UnderWay> underWay; // replies come in this order
    while (ledger_.lastSent(client_) + 1 < Ledger::kMostRecords) {
        while (!control_.isOver && underWay.size() < 1 + random_() % kMostUnderWay) {
            const std::uint64_t number = ledger_.lastSent(client_) + 1;
            const std::size_t length = random_() % (kUsualText * (random_() % 8 == 0 ? 100 : 1));
            wire::Request message{
                .method = Method::sendMessage,
                .id = number,
                .dictionary =
                    Dictionary{{"client", name}, {"number", number}, {"text", std::string(length, 'x')}},
                .category = 5, // output
                .type = 8,     // of the haptic engine
                .reporterIDs = {reporterID}};
            if (Ledger::makesPowerEvent(number)) {
                message.dictionary.set("EngineOnTime", number);
            }
            add(message);
            ledger_.sent(client_, number);
            underWay.push_back({number, control_.roomChanges});
        }
        if (underWay.empty() || !sendAll(socket, outgoing.view())) {
            return;
        }
        outgoing.clear();
        const ssize_t count = ::recv(socket, incoming.room(65536), 65536, 0);
        if (count <= 0) {
            return;
        }
        incoming.commit(static_cast<std::size_t>(count));
        wire::FrameSplitter frames(incoming.bytes());
        while (const auto item = frames.next()) {
            const auto reply = wire::decodeReply(*item);
            if (!reply || reply->error || underWay.empty() || reply->id != underWay.front().number) {
                std::fprintf(stderr, "tamblo_crash: an answer that nobody expects\n");
                std::abort();
            }
            const std::uint64_t before = underWay.front().roomChanges;
            ledger_.answered(client_, reply->id,
                             !CrashControl::hasRoom(before) || before != control_.roomChanges);
            underWay.pop_front();
        }
        incoming.dropFront(incoming.size() - frames.rest().size());
    }
}

} // namespace tamblo::bench
