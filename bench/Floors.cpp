#include "Floors.h"

#include "Bench.h"
#include "ChildProcess.h"
#include "Meter.h"
#include "Payloads.h"
#include "SocketPair.h"
#include "base/TextBuffer.h"

#include <cerrno>
#include <chrono>
#include <system_error>
#include <thread>

#include <sys/socket.h>
#include <unistd.h>

namespace tamblo::bench {

namespace {

constexpr std::size_t kFramesPerWrite = 64;
constexpr std::size_t kBytesPerRead = 128 * 1024;

void sendAll(int socket, const char* data, std::size_t size) {
    while (size > 0) {
        const ssize_t count = ::send(socket, data, size, MSG_NOSIGNAL);
        if (count < 0) {
            throw std::system_error(errno, std::generic_category(), "send");
        }
        data += count;
        size -= static_cast<std::size_t>(count);
    }
}

/// False at the end of the stream.
bool receiveAll(int socket, char* data, std::size_t size) {
    while (size > 0) {
        const ssize_t count = ::recv(socket, data, size, 0);
        if (count <= 0) {
            return false;
        }
        data += count;
        size -= static_cast<std::size_t>(count);
    }
    return true;
}

TextBuffer framesOf(std::size_t count) {
    TextBuffer frames;
    std::uint64_t id = 0;
    for (wire::Request& request : sendRequests(count, 7)) {
        request.id = id++;
        (void)wire::appendRequestFrame(frames, request);
    }
    return frames;
}

} // namespace

SocketFloor measureSocketFloor(int writerProcessor, int readerProcessor, bool quick) {
    const std::size_t writes = quick ? 1000 : 4000;
    const TextBuffer frames = framesOf(kFramesPerWrite);
    const std::size_t bytes = frames.size() * writes;
    pinThisThread(writerProcessor);

    std::vector<double> rate, reader, writer;
    for (int repetition = 0; repetition < 5; ++repetition) {
        SocketPair pair;
        const ChildProcess child(readerProcessor, [&pair, bytes] {
            const auto buffer = std::make_unique<char[]>(kBytesPerRead);
            for (std::size_t read = 0; read < bytes;) {
                const ssize_t count = ::recv(pair.theirs.get(), buffer.get(), kBytesPerRead, 0);
                if (count <= 0) {
                    return;
                }
                read += static_cast<std::size_t>(count);
            }
            sendAll(pair.theirs.get(), "d", 1);
            char never = 0;
            (void)receiveAll(pair.theirs.get(), &never, 1); // lives on until its time has been read
        });
        const Meter meter(child.pid());
        for (std::size_t i = 0; i < writes; ++i) {
            sendAll(pair.ours.get(), frames.data(), frames.size());
        }
        char done = 0;
        if (!receiveAll(pair.ours.get(), &done, 1)) {
            throw std::runtime_error("the reader of the socket floor ended early");
        }
        const auto messages = static_cast<double>(writes * kFramesPerWrite);
        rate.push_back(messages / secondsOf(meter.wall()));
        reader.push_back(microseconds(meter.service()) / messages);
        writer.push_back(microseconds(meter.client()) / messages);
    }
    return {median(rate), median(reader), median(writer)};
}

struct Echo::Ends {
    Ends(int echoProcessor, std::size_t frameBytes)
        : child(echoProcessor, [this, frameBytes] {
              std::vector<char> frame(frameBytes);
              while (receiveAll(pair.theirs.get(), frame.data(), frame.size())) {
                  sendAll(pair.theirs.get(), frame.data(), frame.size());
              }
          }) {}
    SocketPair pair;
    ChildProcess child;
};

Echo::Echo(int callerProcessor, int echoProcessor) {
    pinThisThread(callerProcessor);
    ends_ = std::make_unique<Ends>(echoProcessor, framesOf(1).size());
}

Echo::~Echo() = default;

pid_t Echo::pid() const noexcept {
    return ends_->child.pid();
}

std::vector<double> Echo::roundTrips(std::size_t count) {
    const TextBuffer frame = framesOf(1);
    std::vector<char> answer(frame.size());
    std::vector<double> times;
    times.reserve(count);
    for (std::size_t i = 0; i < count; ++i) {
        const auto start = std::chrono::steady_clock::now();
        sendAll(ends_->pair.ours.get(), frame.data(), frame.size());
        if (!receiveAll(ends_->pair.ours.get(), answer.data(), answer.size())) {
            throw std::runtime_error("the echo ended early");
        }
        times.push_back(microseconds(std::chrono::steady_clock::now() - start));
    }
    return times;
}

double Echo::pacedCost(std::size_t count, std::chrono::nanoseconds interval) {
    const Meter meter(pid());
    auto next = std::chrono::steady_clock::now();
    for (std::size_t i = 0; i < count; ++i) {
        (void)roundTrips(1);
        std::this_thread::sleep_until(next += interval);
    }
    return microseconds(meter.service()) / static_cast<double>(count);
}

void floorSocket(Bench& bench) {
    for (const Placement placement : {Placement::twoCores, Placement::oneCore}) {
        const SocketFloor& floor = bench.socketFloor(placement);
        ResultRow row("floor_socket");
        row.set("messages_per_s", floor.messagesPerSecond);
        row.set("service_cpu_us_per_message", floor.readerMicroseconds);
        row.set("client_cpu_us_per_message", floor.writerMicroseconds);
        row.set("frame_bytes", std::uint64_t{framesOf(1).size()});
        row.set("placement", describe(placement));
        bench.print(row);
    }
}

void floorEcho(Bench& bench) {
    for (const Placement placement : {Placement::twoCores, Placement::oneCore}) {
        const int echoProcessor = bench.place(placement).processor;
        Echo echo(clientProcessor(), echoProcessor);
        (void)echo.roundTrips(1000);
        const std::vector<double> times = echo.roundTrips(bench.quick() ? 5000 : 20000);
        ResultRow row("floor_echo");
        row.set("p50_us", quantile(times, 0.50));
        row.set("p99_us", quantile(times, 0.99));
        row.set("placement", describe(placement));
        bench.print(row);
    }
}

void floorPaced(Bench& bench) {
    constexpr std::size_t kFrames = 1000;
    for (const Placement placement : {Placement::twoCores, Placement::oneCore}) {
        const int echoProcessor = bench.place(placement).processor;
        Echo echo(clientProcessor(), echoProcessor);
        std::vector<double> cpu;
        for (std::size_t repetition = 0; repetition < bench.repetitions(5); ++repetition) {
            cpu.push_back(echo.pacedCost(kFrames, std::chrono::milliseconds(1)));
        }
        ResultRow row("floor_paced");
        row.set("service_cpu_us_per_message", median(cpu));
        row.set("placement", describe(placement));
        bench.print(row);
    }
}

} // namespace tamblo::bench
