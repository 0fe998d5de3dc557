#include "Batches.h"
#include "Bench.h"
#include "ChildProcess.h"
#include "Meter.h"
#include "SocketPair.h"
#include "TemporaryDirectory.h"
#include "base/Json.h"
#include "base/KeySetCache.h"
#include "wire/FrameSplitter.h"

#include <cerrno>
#include <memory>
#include <stdexcept>
#include <system_error>
#include <utility>

#include <fcntl.h>
#include <sys/socket.h>
#include <unistd.h>

namespace tamblo::bench {

namespace {

constexpr std::size_t kBytesPerRead = 128 * 1024;
/// A sink's file has no more either.
constexpr std::size_t kMostFileBytes = std::size_t{64} << 20U;

/// The bare program: no sessions, no clients to tell apart, nothing retained, one line for a message.
class Job {
public:
    Job(int socket, int file) : socket_(socket), file_(file) {}

    /// Until the other end has gone.
    void run() {
        for (;;) {
            const ssize_t count = ::recv(socket_, incoming_.room(kBytesPerRead), kBytesPerRead, 0);
            if (count <= 0) {
                return;
            }
            incoming_.commit(static_cast<std::size_t>(count));
            wire::FrameSplitter frames(incoming_.bytes());
            while (const auto item = frames.next()) {
                take(*item);
            }
            incoming_.dropFront(incoming_.size() - frames.rest().size());
            append();
            answer();
        }
    }

private:
    void take(std::span<const std::uint8_t> item) {
        if (wire::decodeRequest(item, keySets_, request_) || !request_.id) {
            throw std::runtime_error("not a request that asks for a reply");
        }
        if (request_.dictionary != previous_) {
            previous_ = request_.dictionary;
            appendJson(lines_, Value(previous_));
            lines_.append('\n');
        }
        wire::appendNullReply(replies_, *request_.id);
    }

    void append() {
        if (written_ + lines_.size() > kMostFileBytes) {
            (void)!::ftruncate(file_, 0);
            written_ = 0;
        }
        if (::write(file_, lines_.data(), lines_.size()) != static_cast<ssize_t>(lines_.size())) {
            throw std::system_error(errno, std::generic_category(), "write");
        }
        written_ += lines_.size();
        lines_.clear();
    }

    void answer() {
        for (std::size_t sent = 0; sent < replies_.size();) {
            const ssize_t count =
                ::send(socket_, replies_.data() + sent, replies_.size() - sent, MSG_NOSIGNAL);
            if (count < 0) {
                throw std::system_error(errno, std::generic_category(), "send");
            }
            sent += static_cast<std::size_t>(count);
        }
        replies_.clear();
    }

    int socket_;
    int file_;
    KeySetCache keySets_;
    wire::Request request_;
    Dictionary previous_;
    TextBuffer incoming_;
    TextBuffer lines_;
    TextBuffer replies_;
    std::size_t written_ = 0;
};

FileDescriptor openLines(const std::string& path) {
    FileDescriptor file(::open(path.c_str(), O_WRONLY | O_CREAT | O_APPEND | O_CLOEXEC, 0600));
    if (!file.isOpen()) {
        throw std::system_error(errno, std::generic_category(), path);
    }
    return file;
}

} // namespace

struct BareJob::Ends {
    Ends(int jobProcessor, const std::string& directory)
        : scratch(directory),
          lines(openLines(scratch.path() + "/lines")),
          child(jobProcessor, [this] { Job(pair.theirs.get(), lines.get()).run(); }),
          channel(std::move(pair.ours)) {
        pair.theirs.reset();
    }
    TemporaryDirectory scratch;
    FileDescriptor lines;
    SocketPair pair;
    ChildProcess child;
    FrameChannel channel;
    Batches batches{channel};
};

BareJob::BareJob(int clientProcessor, int jobProcessor, const std::string& directory) {
    pinThisThread(clientProcessor);
    ends_ = std::make_unique<Ends>(jobProcessor, directory);
}

BareJob::~BareJob() = default;

BareJob::Cost BareJob::run(std::size_t messages) {
    const Meter meter(ends_->child.pid());
    ends_->batches.send(messages, 7);
    const auto count = static_cast<double>(messages);
    return {.messagesPerSecond = count / secondsOf(meter.wall()),
            .jobMicroseconds = microseconds(meter.service()) / count,
            .clientMicroseconds = microseconds(meter.client()) / count};
}

void floorJob(Bench& bench) {
    constexpr std::size_t kMessages = 100'000;
    for (const Placement placement : {Placement::twoCores, Placement::oneCore}) {
        const std::unique_ptr<BareJob> job = bench.bareJob(placement);
        (void)job->run(kMessages / 10);
        std::vector<double> rate, cost, client;
        for (std::size_t repetition = 0; repetition < bench.repetitions(7); ++repetition) {
            const BareJob::Cost figures = job->run(kMessages);
            rate.push_back(figures.messagesPerSecond);
            cost.push_back(figures.jobMicroseconds);
            client.push_back(figures.clientMicroseconds);
        }
        ResultRow row = bench.row("floor_job", placement);
        row.set("messages_per_s", median(rate));
        row.set("service_cpu_us_per_message", median(cost));
        row.set("client_cpu_us_per_message", median(client));
        bench.print(row);
    }
}

} // namespace tamblo::bench
