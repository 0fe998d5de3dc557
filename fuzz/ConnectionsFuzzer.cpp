// Several clients of the whole service over its real socket: requests, halves of frames, ends of connections
// and notifications in any order. Nothing may crash; a client that does no harm is answered; and what it all
// costs, in processor time, memory, bytes of the sinks and of the log, stays in proportion to what was sent.

#include "RunningService.h"
#include "base/Cbor.h"
#include "os/LocalAddress.h"
#include "platform/Limits.h"
#include "wire/FrameSplitter.h"
#include "wire/Reply.h"
#include "wire/Request.h"

#include <fuzzer/FuzzedDataProvider.h>
#include <sanitizer/allocator_interface.h>

#include <algorithm>
#include <array>
#include <cstdio>
#include <map>
#include <vector>

#include <poll.h>
#include <sys/socket.h>

namespace tamblo {
namespace {

using fuzz::demand;
using fuzz::RunningService;
using wire::Method;

constexpr std::size_t kClients = 6;
/// The type of messages that are no repetitions, whatever they say.
constexpr std::uint16_t kError = 6;
constexpr int kPatienceMilliseconds = 60'000;

int complaints = STDERR_FILENO; ///< where the fuzzer's own output goes

double secondsOn(clockid_t clock) {
    timespec time{};
    ::clock_gettime(clock, &time);
    return static_cast<double>(time.tv_sec) + static_cast<double>(time.tv_nsec) * 1e-9;
}

/// A client that sends what it is told and drops what it is answered.
class Client {
public:
    Client() : socket_(::socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC | SOCK_NONBLOCK, 0)) {
        const auto address = LocalAddress::of(RunningService::get().socketPath());
        demand(::connect(socket_, address->get(), address->size()) == 0);
    }
    ~Client() { ::close(socket_); }
    Client(const Client&) = delete;
    Client& operator=(const Client&) = delete;

    /// How many bytes have left; fewer when the service has ended the connection or takes no more.
    std::size_t send(std::string_view bytes) {
        std::size_t sent = 0;
        while (sent < bytes.size() && wait(POLLOUT | POLLIN)) {
            receive();
            const ssize_t count =
                ::send(socket_, bytes.data() + sent, bytes.size() - sent, MSG_NOSIGNAL | MSG_DONTWAIT);
            if (count < 0 && errno != EAGAIN) {
                isLost_ = true;
                break;
            }
            sent += count > 0 ? static_cast<std::size_t>(count) : 0U;
        }
        return sent;
    }
    /// Waits until a request of no consequence, behind all that was sent, is answered.
    [[nodiscard]] bool settle() {
        TextBuffer frame;
        (void)wire::appendRequestFrame(frame, wire::Request{.method = Method::reporterID, .id = kSettling});
        isSettled_ = false;
        send(frame.view());
        while (!isSettled_ && !isLost_ && wait(POLLIN)) {
            receive();
        }
        return isSettled_ || isLost_;
    }
    void hasBegunAFrame() noexcept { hasBegun_ = true; }
    [[nodiscard]] bool canSettle() const noexcept { return !hasBegun_ && !isLost_; }

private:
    static constexpr std::uint64_t kSettling = 0xFFFFFFFFFFFF;

    [[nodiscard]] bool wait(int events) const {
        pollfd waiting{socket_, static_cast<short>(events), 0};
        return !isLost_ && ::poll(&waiting, 1, kPatienceMilliseconds) > 0;
    }
    void receive() {
        std::array<std::uint8_t, 65536> bytes;
        const ssize_t count = ::recv(socket_, bytes.data(), bytes.size(), MSG_DONTWAIT);
        if (count <= 0) {
            isLost_ = isLost_ || count == 0 || errno != EAGAIN;
            return;
        }
        received_.insert(received_.end(), bytes.begin(), bytes.begin() + count);
        wire::FrameSplitter frames(received_);
        while (const auto item = frames.next()) {
            const auto reply = wire::decodeReply(*item);
            demand(reply.has_value());
            isSettled_ = isSettled_ || reply->id == kSettling;
        }
        received_.erase(received_.begin(),
                        received_.end() - static_cast<std::ptrdiff_t>(frames.rest().size()));
    }

    int socket_;
    std::vector<std::uint8_t> received_;
    bool isSettled_ = false;
    bool isLost_ = false;
    bool hasBegun_ = false;
};

/// What an input has sent, and what may come of it.
class Bill {
public:
    Bill()
        : cpu_(cpu()),
          allocated_(__sanitizer_get_current_allocated_bytes()),
          written_(RunningService::get().bytesWritten()),
          logged_(RunningService::get().bytesLogged()) {}

    void sent(std::size_t bytes) noexcept { bytes_ += static_cast<double>(bytes); }
    void delivers(std::size_t messages, std::size_t bytes) noexcept {
        deliveries_ += static_cast<double>(messages);
        deliveredBytes_ += static_cast<double>(messages) * static_cast<double>(bytes);
    }
    /// For people: what was sent.
    void tell(const char* what, std::size_t times) {
        if (told_.size() < 2'000) {
            told_ += std::string(" ") + what + " x" + std::to_string(times);
        }
    }
    void look() noexcept { peak_ = std::max<std::size_t>(peak_, __sanitizer_get_current_allocated_bytes()); }
    /// Ends the process when anything cost too much.
    void settle(double secondsOfMessage) {
        look();
        check("processor in seconds", cpu() - cpu_, 0.5 + secondsOfMessage * (4 * deliveries_ + bytes_ / 2));
        check("memory in bytes", static_cast<double>(peak_) - static_cast<double>(allocated_),
              16e6 + 24 * bytes_ + 2'000 * deliveries_ + 8 * deliveredBytes_);
        check("sinks in bytes",
              static_cast<double>(RunningService::get().bytesWritten()) - static_cast<double>(written_),
              1e6 + 20 * bytes_ + 4'000 * deliveries_ + 8 * deliveredBytes_);
        check("log in bytes",
              static_cast<double>(RunningService::get().bytesLogged()) - static_cast<double>(logged_),
              100e3 + 4 * bytes_);
    }

private:
    [[nodiscard]] static double cpu() {
        return secondsOn(CLOCK_PROCESS_CPUTIME_ID) - secondsOn(CLOCK_THREAD_CPUTIME_ID);
    }
    /// $FUZZED_COSTS names those that count, such as "log memory"; all do without it. The service goes on
    /// with what is left of an input, such as summaries, while the next one has begun: what an input was
    /// granted and did not spend is there for the next.
    void check(std::string_view what, double cost, double granted) const {
        static const char* const chosen = std::getenv("FUZZED_COSTS");
        static std::map<std::string_view, double> unspent;
        const double available = granted + unspent[what];
        const bool counts =
            chosen == nullptr || std::string_view(chosen).find(what.substr(0, what.find(' '))) != what.npos;
        if (counts && cost > available) {
            ::dprintf(complaints, "COST of %s: %.3g where %.3g is granted for %.0f bytes sent:%s\n",
                      std::string(what).c_str(), cost, available, bytes_, told_.c_str());
            std::abort();
        }
        unspent[what] = std::min(granted, available - cost);
    }

    double cpu_;
    std::size_t allocated_;
    std::uint64_t written_;
    std::uint64_t logged_;
    std::size_t peak_ = 0;
    double bytes_ = 0;
    double deliveries_ = 0;
    double deliveredBytes_ = 0;
    std::string told_;
};

class Play {
public:
    explicit Play(FuzzedDataProvider& input) : input_(input) {}

    void run() {
        begin();
        while (input_.remaining_bytes() > 0) {
            act();
            bill_.look();
        }
    }
    /// All that can be answered is, and then all connections end.
    Bill& end() {
        for (const auto& client : clients_) {
            demand(client == nullptr || !client->canSettle() || client->settle());
            bill_.look();
        }
        clients_ = {};
        idle_.clear();
        return bill_;
    }

private:
    /// Two clients have sessions to begin with, all of them started but the last one of each.
    void begin() {
        for (std::size_t i = 0; i < 2; ++i) {
            for (std::int64_t reporter = 1; reporter <= 3; ++reporter) {
                wire::Request request{.method = Method::createReportingSession,
                                      .reporterID = reporter + 3 * static_cast<std::int64_t>(i),
                                      .serviceType = static_cast<std::uint16_t>(9 + reporter)};
                for (const Method method : {Method::createReportingSession, Method::setServiceType,
                                            Method::startReportingSessionForID}) {
                    request.method = method;
                    if (reporter < 3 || method != Method::startReportingSessionForID) {
                        (void)wire::appendRequestFrame(frames_, request);
                    }
                }
            }
            clients_[i] = std::make_unique<Client>();
            bill_.sent(clients_[i]->send(frames_.view()));
            frames_.clear();
        }
        started_ = 4;
    }

    enum class Act : std::uint8_t {
        request,
        keys,
        kinds,
        reporters,
        arrays,
        text,
        half,
        bytes,
        close,
        idle,
        post,
        kMaxValue = post
    };

    void act() {
        auto& client = clients_[input_.ConsumeIntegralInRange<std::size_t>(0, kClients - 1)];
        if (client == nullptr) {
            client = std::make_unique<Client>();
        }
        frames_.clear();
        switch (input_.ConsumeEnum<Act>()) {
        case Act::request:
            addRequests();
            break;
        case Act::keys:
            addMessages([](std::size_t i) { return Dictionary{{"key" + std::to_string(i), 1}}; }, false);
            break;
        case Act::kinds:
            addMessages([](std::size_t i) { return Dictionary{{"n", i}}; }, true);
            break;
        case Act::reporters:
            addReporters();
            break;
        case Act::arrays:
            addArrays();
            break;
        case Act::text:
            addText();
            break;
        case Act::half:
            addHalf();
            client->hasBegunAFrame();
            break;
        case Act::bytes:
            frames_.append(input_.ConsumeRandomLengthString(64));
            client->hasBegunAFrame();
            break;
        case Act::close:
            client.reset();
            return;
        case Act::idle:
            idle_.resize(std::min<std::size_t>(idle_.size() + input_.ConsumeIntegral<std::uint8_t>(), 300));
            for (auto& connection : idle_) {
                connection = connection == nullptr ? std::make_unique<Client>() : std::move(connection);
            }
            bill_.tell("idle", idle_.size());
            bill_.sent(1'000 * idle_.size()); // a connection has its price
            return;
        case Act::post:
            RunningService::get().post(input_.ConsumeIntegral<std::uint64_t>());
            return;
        }
        bill_.sent(client->send(frames_.view()));
    }

    [[nodiscard]] std::int64_t reporterID() { return input_.ConsumeIntegralInRange<std::int64_t>(0, 7); }
    [[nodiscard]] std::size_t count(std::size_t most) {
        // A few, or very many.
        return input_.ConsumeBool() ? input_.ConsumeIntegralInRange<std::size_t>(1, 8)
                                    : input_.ConsumeIntegralInRange<std::size_t>(1, most);
    }
    void add(wire::Request& request) {
        request.id = input_.ConsumeBool() ? std::optional<std::uint64_t>(++lastId_) : std::nullopt;
        (void)wire::appendRequestFrame(frames_, request);
    }

    /// One request, over and over, for the same reporter or for others each time.
    void addRequests() {
        const auto method = static_cast<Method>(
            input_.ConsumeIntegralInRange<int>(0, static_cast<int>(wire::kMethods.size()) - 1));
        const bool isForMany = input_.ConsumeBool();
        wire::Request request{.method = method,
                              .reporterID = reporterID(),
                              .serviceType = input_.ConsumeIntegralInRange<std::uint16_t>(0, 14),
                              .dictionary = Dictionary{{"HostApplicationDisplayID", "fuzzer"}},
                              .category = 4,
                              .type = 1,
                              .reporterIDs = {}};
        const std::size_t times = count(method == Method::sendMessage ? 300 : 6'000);
        bill_.tell(wire::rowOf(method).name.data(), times);
        for (std::size_t i = 0; i < times; ++i) {
            add(request);
            request.reporterID += isForMany ? 10 : 0;
            started_ += method == Method::startReportingSessionForID ? 1U : 0U;
        }
        if (method == Method::sendMessage) {
            bill_.delivers(times * (started_ + 1), 200);
        }
    }
    template <typename Payload> void addMessages(const Payload& payload, bool hasKinds) {
        const std::int64_t reporter = reporterID();
        const std::size_t times = count(8'000);
        bill_.tell(hasKinds ? "kinds" : "keys", times);
        for (std::size_t i = 0; i < times; ++i) {
            wire::Request request{.method = Method::sendMessage,
                                  .dictionary = payload(messages_++),
                                  .category = hasKinds ? static_cast<std::uint32_t>(7 * i) : 4,
                                  .type = static_cast<std::uint16_t>(hasKinds ? i : 1),
                                  .reporterIDs = {reporter}};
            add(request);
        }
        bill_.delivers(times, 200);
    }
    void addReporters() {
        const std::size_t times = count(20'000);
        bill_.tell("reporters", times);
        const std::string text(input_.ConsumeIntegralInRange<std::size_t>(0, 20'000), 'x');
        wire::Request request{.method = Method::sendMessage,
                              .dictionary = Dictionary{{"text", text}},
                              .category = 4,
                              .type = input_.ConsumeBool() ? kError : std::uint16_t{1},
                              .reporterIDs = std::vector<std::int64_t>(times, reporterID())};
        add(request);
        bill_.delivers(std::min(times, Limits{}.reportersOfMessage), text.size() + 200);
    }
    void addArrays() {
        const std::size_t times = count(900'000);
        bill_.tell("arrays", times);
        const std::size_t start = wire::beginRequest(frames_, Method::sendMessage, ++lastId_);
        CborWriter writer(frames_);
        writer.mapHead(1);
        writer.text("arrays");
        writer.arrayHead(times);
        for (std::size_t i = 0; i < times; ++i) {
            writer.arrayHead(0);
        }
        writer.unsignedInteger(4);
        writer.unsignedInteger(1);
        writer.arrayHead(1);
        writer.integer(reporterID());
        (void)wire::finishFrame(frames_, start);
        bill_.delivers(1, 200);
    }
    /// A configuration of one long text.
    void addText() {
        wire::Request request{.method = Method::setConfiguration,
                              .reporterID = reporterID(),
                              .dictionary =
                                  Dictionary{{input_.ConsumeBool() ? "HostApplicationDisplayID" : "other",
                                              std::string(count(900'000), 'x')}}};
        add(request);
        bill_.tell("configuration of", frames_.size());
    }
    void addHalf() {
        const auto length = input_.ConsumeIntegralInRange<std::uint32_t>(1, 1U << 20U);
        bill_.tell("half frame", length);
        frames_.append({reinterpret_cast<const char*>(&length), sizeof length});
        frames_.append(std::string(length - 1, '\x80'));
    }

    FuzzedDataProvider& input_;
    Bill bill_;
    std::array<std::unique_ptr<Client>, kClients> clients_;
    std::vector<std::unique_ptr<Client>> idle_;
    TextBuffer frames_;
    std::uint64_t lastId_ = 0;
    std::size_t messages_ = 0;
    std::size_t started_ = 0;
};

/// The client that does no harm.
class Bystander {
public:
    static Bystander& get() {
        static auto* const bystander = new Bystander;
        return *bystander;
    }
    void demandService() { demand(client_.settle()); }
    /// Of the service's processor time, for a message of the usual kind, as this build and machine have it.
    [[nodiscard]] double secondsOfMessage() const noexcept { return secondsOfMessage_; }

private:
    static constexpr std::int64_t kReporterID = 1'000'000;

    Bystander() {
        TextBuffer frames;
        (void)wire::appendRequestFrame(
            frames, wire::Request{.method = Method::createReportingSession, .reporterID = kReporterID});
        (void)wire::appendRequestFrame(
            frames, wire::Request{.method = Method::startReportingSessionForID, .reporterID = kReporterID});
        constexpr std::size_t kMessages = 400;
        for (std::size_t i = 0; i < kMessages; ++i) {
            (void)wire::appendRequestFrame(frames, wire::Request{.method = Method::sendMessage,
                                                                 .dictionary = Dictionary{{"n", i}},
                                                                 .category = 4,
                                                                 .type = 1,
                                                                 .reporterIDs = {kReporterID}});
        }
        const double before = secondsOn(CLOCK_PROCESS_CPUTIME_ID);
        client_.send(frames.view());
        demand(client_.settle());
        secondsOfMessage_ = (secondsOn(CLOCK_PROCESS_CPUTIME_ID) - before) / kMessages;
    }

    Client client_;
    double secondsOfMessage_ = 0;
};

} // namespace
} // namespace tamblo

/// The fuzzer's output leaves the descriptor that the service logs to. Scripts are long from the start on.
extern "C" int LLVMFuzzerInitialize(int* count, char*** arguments) {
    static std::array<std::string, 3> options{"-close_fd_mask=2", "-len_control=0", "-max_len=400"};
    static std::vector<char*> all(*arguments, *arguments + *count);
    for (std::string& option : options) {
        all.push_back(option.data());
    }
    all.push_back(nullptr);
    *arguments = all.data();
    *count = static_cast<int>(all.size()) - 1;
    tamblo::complaints = ::dup(STDERR_FILENO);
    return 0;
}

/// Instead of the library's, which the fuzzer would call at its end: nothing is torn down while the service's
/// threads run, not even what they have made last.
extern "C" void exit(int status) noexcept {
    tamblo::RunningService::get().remove();
    std::_Exit(status);
}

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* bytes, std::size_t size) {
    using namespace tamblo;
    constexpr std::size_t kMostBytes = 400; // of the script, not of what is sent
    if (size > kMostBytes) {
        return -1;
    }
    RunningService::get().clear();
    Bystander::get().demandService();
    FuzzedDataProvider input(bytes, size);
    Play play(input);
    play.run();
    Bystander::get().demandService();
    Bill& bill = play.end();
    // The connections' ends are carried out before what comes later is answered.
    Bystander::get().demandService();
    bill.settle(Bystander::get().secondsOfMessage());
    return 0;
}
