#include "base/Mutex.h"
#include "client/Client.h"
#include "client/tamblo.h"

#include <chrono>
#include <condition_variable>
#include <exception>
#include <new>
#include <span>
#include <type_traits>
#include <utility>

using namespace tamblo::client;

namespace {

using Milliseconds = std::chrono::milliseconds;

/// How many requests with a callback are not answered yet, for those who wait until none is.
class Unanswered {
public:
    void add() {
        const tamblo::MutexLock lock(mutex_);
        ++count_;
    }
    void remove() {
        const tamblo::MutexLock lock(mutex_);
        if (--count_ == 0) {
            none_.notify_all();
        }
    }
    [[nodiscard]] bool isNone() {
        const tamblo::MutexLock lock(mutex_);
        return count_ == 0;
    }
    [[nodiscard]] bool waitForNone(std::chrono::steady_clock::time_point end) {
        tamblo::MutexLock lock(mutex_);
        while (count_ != 0 && none_.wait_until(lock.forWaiting(), end) == std::cv_status::no_timeout) {
        }
        return count_ == 0;
    }

private:
    tamblo::Mutex mutex_;
    std::condition_variable none_;
    std::size_t count_ TAMBLO_GUARDED_BY(mutex_) = 0;
};

} // namespace

struct tamblo_client {
    explicit tamblo_client(Client::Options options)
        : isPumpedByCaller(options.threading == Client::Threading::caller), client(std::move(options)) {}

    const bool isPumpedByCaller;
    /// The client's last callbacks count here.
    Unanswered unanswered;
    Client client;
};

struct tamblo_payload {
    tamblo::Dictionary dictionary;
};

namespace {

/// The header's names stand for what the protocol means by them; those between follow one another in both.
static_assert(TAMBLO_SUBSYSTEM_MIDI == static_cast<std::uint32_t>(Subsystem::midi) &&
              TAMBLO_SUBSYSTEM_SESSION == static_cast<std::uint32_t>(Subsystem::session) &&
              TAMBLO_SUBSYSTEM_DSP == static_cast<std::uint32_t>(Subsystem::dsp) &&
              TAMBLO_SUBSYSTEM_HAL == static_cast<std::uint32_t>(Subsystem::hal) &&
              TAMBLO_SUBSYSTEM_ROUTING == static_cast<std::uint32_t>(Subsystem::routing) &&
              TAMBLO_SUBSYSTEM_TOOLBOX == static_cast<std::uint32_t>(Subsystem::toolbox));
static_assert(TAMBLO_KIND_GENERIC == static_cast<int>(EventKind::generic) &&
              TAMBLO_KIND_ERROR == static_cast<int>(EventKind::error) &&
              TAMBLO_KIND_WIRRELS == static_cast<int>(EventKind::wirrels));
static_assert(TAMBLO_TYPE_ISSUE_DETECTOR == static_cast<int>(EventType::issueDetector) &&
              TAMBLO_TYPE_MEMORY_LOG == static_cast<int>(EventType::memoryLog) &&
              TAMBLO_TYPE_UNKNOWN == static_cast<int>(EventType::unknown));
static_assert(TAMBLO_SERVICE_LONG_FORM_AUDIO == static_cast<int>(ServiceType::longFormAudio) &&
              TAMBLO_SERVICE_SYSTEM_SOUNDS == static_cast<int>(ServiceType::systemSounds) &&
              TAMBLO_SERVICE_UNKNOWN == static_cast<int>(ServiceType::unknown));
static_assert(TAMBLO_ERROR_DOMAIN == kErrorDomain &&
              TAMBLO_ERROR_CONNECTION_LOST == static_cast<int>(ErrorCode::connectionLost) &&
              TAMBLO_ERROR_TOO_MANY_PENDING == static_cast<int>(ErrorCode::tooManyPending));

/// A C callback as one of the library's. The answer is counted where it is waited for.
template <typename T>
Callback<T> callbackFor(tamblo_reply reply, void* context, Unanswered* unanswered = nullptr) {
    if (reply == nullptr) {
        return nullptr;
    }
    return [reply, context, unanswered](Result<T>&& result) {
        if (result.error) {
            const tamblo_error error{result.error->domain.c_str(), result.error->code,
                                     result.error->message.c_str()};
            reply(context, &error, 0);
        } else if constexpr (std::is_same_v<T, Nothing>) {
            reply(context, nullptr, 0);
        } else {
            reply(context, nullptr, static_cast<std::int64_t>(result.value));
        }
        if (unanswered != nullptr) {
            unanswered->remove();
        }
    };
}

Client::Options optionsFrom(const tamblo_options& from) {
    Client::Options options;
    if (from.socket_path != nullptr) {
        options.socketPath = from.socket_path;
    }
    options.threading =
        from.threading == TAMBLO_CALLER ? Client::Threading::caller : Client::Threading::background;
    if (from.queue_capacity != 0) {
        options.queueCapacity = from.queue_capacity;
    }
    options.reconnect = !from.no_reconnect;
    if (from.state_changed != nullptr) {
        options.onState = [changed = from.state_changed, context = from.context](ConnectionState state) {
            changed(context, static_cast<tamblo_state>(state));
        };
    }
    return options;
}

/// No exception crosses into C: one means that there is no memory, and the act was not done.
template <typename Act> bool guarded(const Act& act) noexcept {
    try {
        return act();
    } catch (const std::exception&) {
        return false;
    }
}

/// Sends a request whose answer `tamblo_client_wait` waits for; the act queues it with the callback given.
template <typename T, typename Act>
bool ask(tamblo_client* client, tamblo_reply reply, void* context, const Act& act) noexcept {
    if (reply == nullptr) {
        return guarded([&] { return act(client->client, Callback<T>()); });
    }
    client->unanswered.add();
    const bool isQueued =
        guarded([&] { return act(client->client, callbackFor<T>(reply, context, &client->unanswered)); });
    if (!isQueued) {
        client->unanswered.remove();
    }
    return isQueued;
}

void set(tamblo_payload* payload, const char* key, auto&& makeValue) noexcept {
    guarded([&] {
        if (payload != nullptr) {
            payload->dictionary.set(key, makeValue());
        }
        return true;
    });
}

const tamblo::Dictionary& entriesOf(const tamblo_payload* payload) noexcept {
    static const tamblo::Dictionary none;
    return payload != nullptr ? payload->dictionary : none;
}

void setArray(tamblo_payload* payload, const char* key, auto elements) noexcept {
    set(payload, key, [&] {
        tamblo::Array array;
        array.reserve(elements.size());
        for (const auto& element : elements) {
            array.emplace_back(element);
        }
        return tamblo::Value(std::move(array));
    });
}

} // namespace

tamblo_client* tamblo_client_create(const tamblo_options* options) {
    tamblo_client* client = nullptr;
    guarded([&] {
        const tamblo_options usual{};
        client = new tamblo_client(optionsFrom(options == nullptr ? usual : *options));
        return true;
    });
    return client;
}

void tamblo_client_destroy(tamblo_client* client) {
    delete client;
}

bool tamblo_client_is_connected(const tamblo_client* client) {
    return client->client.isConnected();
}

uint64_t tamblo_client_refused_messages(const tamblo_client* client) {
    return client->client.refusedMessages();
}

bool tamblo_client_flush(tamblo_client* client, int timeout_ms) {
    return guarded([&] { return client->client.flush(Milliseconds(timeout_ms)); });
}

bool tamblo_client_wait(tamblo_client* client, int timeout_ms) {
    return guarded([&] {
        const auto end = std::chrono::steady_clock::now() + Milliseconds(timeout_ms);
        if (!client->isPumpedByCaller) {
            return client->unanswered.waitForNone(end);
        }
        while (!client->unanswered.isNone()) {
            const auto left = std::chrono::ceil<Milliseconds>(end - std::chrono::steady_clock::now());
            if (left.count() <= 0) {
                return false;
            }
            client->client.run(left);
        }
        return true;
    });
}

bool tamblo_client_connect(tamblo_client* client) {
    return guarded([&] { return client->client.connect(); });
}

size_t tamblo_client_run(tamblo_client* client, int timeout_ms) {
    size_t handled = 0;
    guarded([&] {
        handled = client->client.run(Milliseconds(timeout_ms));
        return true;
    });
    return handled;
}

tamblo_payload* tamblo_payload_create(void) {
    return new (std::nothrow) tamblo_payload;
}

void tamblo_payload_destroy(tamblo_payload* payload) {
    delete payload;
}

void tamblo_payload_clear(tamblo_payload* payload) {
    if (payload != nullptr) {
        payload->dictionary = {};
    }
}

void tamblo_payload_set_string(tamblo_payload* payload, const char* key, const char* value) {
    set(payload, key, [&] { return tamblo::Value(value); });
}

void tamblo_payload_set_int(tamblo_payload* payload, const char* key, int64_t value) {
    set(payload, key, [&] { return tamblo::Value(value); });
}

void tamblo_payload_set_uint(tamblo_payload* payload, const char* key, uint64_t value) {
    set(payload, key, [&] { return tamblo::Value(value); });
}

void tamblo_payload_set_double(tamblo_payload* payload, const char* key, double value) {
    set(payload, key, [&] { return tamblo::Value(value); });
}

void tamblo_payload_set_float(tamblo_payload* payload, const char* key, float value) {
    set(payload, key, [&] { return tamblo::Value(value); });
}

void tamblo_payload_set_bool(tamblo_payload* payload, const char* key, bool value) {
    set(payload, key, [&] { return tamblo::Value(value); });
}

void tamblo_payload_set_date(tamblo_payload* payload, const char* key, double seconds) {
    set(payload, key, [&] { return tamblo::Value::date(seconds); });
}

void tamblo_payload_set_data(tamblo_payload* payload, const char* key, const void* bytes, size_t length) {
    set(payload, key, [&] { return tamblo::Value::data({static_cast<const std::uint8_t*>(bytes), length}); });
}

void tamblo_payload_set_strings(tamblo_payload* payload, const char* key, const char* const* values,
                                size_t count) {
    setArray(payload, key, std::span(values, count));
}

void tamblo_payload_set_ints(tamblo_payload* payload, const char* key, const int64_t* values, size_t count) {
    setArray(payload, key, std::span(values, count));
}

void tamblo_payload_set_doubles(tamblo_payload* payload, const char* key, const double* values,
                                size_t count) {
    setArray(payload, key, std::span(values, count));
}

void tamblo_payload_set_payload(tamblo_payload* payload, const char* key, const tamblo_payload* value) {
    set(payload, key, [&] { return tamblo::Value(entriesOf(value)); });
}

bool tamblo_client_send(tamblo_client* client, const tamblo_payload* payload, uint32_t category,
                        uint16_t type, const int64_t* reporter_ids, size_t reporter_count, tamblo_reply reply,
                        void* context) {
    return ask<Nothing>(client, reply, context, [&](Client& to, Callback<Nothing> callback) {
        return to.sendMessage(entriesOf(payload), static_cast<EventCategory>(category),
                              static_cast<EventType>(type), {reporter_ids, reporter_count},
                              std::move(callback));
    });
}

bool tamblo_client_create_session(tamblo_client* client, int64_t reporter_id, tamblo_reply reply,
                                  void* context) {
    return ask<bool>(client, reply, context, [&](Client& to, Callback<bool> callback) {
        return to.createReportingSession(reporter_id, std::move(callback));
    });
}

bool tamblo_client_set_service_type(tamblo_client* client, uint16_t service_type, int64_t reporter_id,
                                    tamblo_reply reply, void* context) {
    return ask<bool>(client, reply, context, [&](Client& to, Callback<bool> callback) {
        return to.setServiceType(static_cast<ServiceType>(service_type), reporter_id, std::move(callback));
    });
}

bool tamblo_client_set_configuration(tamblo_client* client, const tamblo_payload* configuration,
                                     int64_t reporter_id, tamblo_reply reply, void* context) {
    return ask<bool>(client, reply, context, [&](Client& to, Callback<bool> callback) {
        return to.setConfiguration(entriesOf(configuration), reporter_id, std::move(callback));
    });
}

bool tamblo_client_start_session(tamblo_client* client, int64_t reporter_id, tamblo_reply reply,
                                 void* context) {
    return guarded([&] {
        return client->client.startReportingSessionForID(reporter_id, callbackFor<bool>(reply, context));
    });
}

bool tamblo_client_stop_session(tamblo_client* client, int64_t reporter_id, tamblo_reply reply,
                                void* context) {
    return ask<bool>(client, reply, context, [&](Client& to, Callback<bool> callback) {
        return to.stopReportingSessionForID(reporter_id, std::move(callback));
    });
}

bool tamblo_client_destroy_session(tamblo_client* client, int64_t reporter_id, tamblo_reply reply,
                                   void* context) {
    return ask<bool>(client, reply, context, [&](Client& to, Callback<bool> callback) {
        return to.destroyReportingSession(reporter_id, std::move(callback));
    });
}

bool tamblo_client_get_service_type(tamblo_client* client, int64_t reporter_id, tamblo_reply reply,
                                    void* context) {
    return ask<ServiceType>(client, reply, context, [&](Client& to, Callback<ServiceType> callback) {
        return to.getServiceNameForReporterID(reporter_id, std::move(callback));
    });
}
