#include "client/Client.h"
#include "client/tamblo.h"

#include <chrono>
#include <exception>
#include <new>
#include <type_traits>

using namespace tamblo::client;

struct tamblo_client {
    Client client;
};

struct tamblo_payload {
    tamblo::Dictionary dictionary;
};

namespace {

/// A C callback as one of the library's.
template <typename T> Callback<T> callbackFor(tamblo_reply reply, void* context) {
    if (reply == nullptr) {
        return nullptr;
    }
    return [reply, context](Result<T>&& result) {
        if (result.error) {
            const tamblo_error error{result.error->domain.c_str(), result.error->code,
                                     result.error->message.c_str()};
            reply(context, &error, 0);
        } else if constexpr (std::is_same_v<T, Nothing>) {
            reply(context, nullptr, 0);
        } else {
            reply(context, nullptr, static_cast<std::int64_t>(result.value));
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

void set(tamblo_payload* payload, const char* key, auto&& makeValue) noexcept {
    guarded([&] {
        payload->dictionary.set(key, makeValue());
        return true;
    });
}

} // namespace

tamblo_client* tamblo_client_create(const tamblo_options* options) {
    tamblo_client* client = nullptr;
    guarded([&] {
        const tamblo_options usual{};
        client = new tamblo_client{Client(optionsFrom(options == nullptr ? usual : *options))};
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
    return guarded([&] { return client->client.flush(std::chrono::milliseconds(timeout_ms)); });
}

bool tamblo_client_connect(tamblo_client* client) {
    return guarded([&] { return client->client.connect(); });
}

size_t tamblo_client_run(tamblo_client* client, int timeout_ms) {
    size_t handled = 0;
    guarded([&] {
        handled = client->client.run(std::chrono::milliseconds(timeout_ms));
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
    payload->dictionary = {};
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

bool tamblo_client_send(tamblo_client* client, const tamblo_payload* payload, uint32_t category,
                        uint16_t type, const int64_t* reporter_ids, size_t reporter_count, tamblo_reply reply,
                        void* context) {
    return guarded([&] {
        return client->client.sendMessage(payload->dictionary, static_cast<EventCategory>(category),
                                          static_cast<EventType>(type), {reporter_ids, reporter_count},
                                          callbackFor<Nothing>(reply, context));
    });
}

bool tamblo_client_create_session(tamblo_client* client, int64_t reporter_id, tamblo_reply reply,
                                  void* context) {
    return guarded([&] {
        return client->client.createReportingSession(reporter_id, callbackFor<bool>(reply, context));
    });
}

bool tamblo_client_set_service_type(tamblo_client* client, uint16_t service_type, int64_t reporter_id,
                                    tamblo_reply reply, void* context) {
    return guarded([&] {
        return client->client.setServiceType(static_cast<ServiceType>(service_type), reporter_id,
                                             callbackFor<bool>(reply, context));
    });
}

bool tamblo_client_set_configuration(tamblo_client* client, const tamblo_payload* configuration,
                                     int64_t reporter_id, tamblo_reply reply, void* context) {
    return guarded([&] {
        return client->client.setConfiguration(configuration->dictionary, reporter_id,
                                               callbackFor<bool>(reply, context));
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
    return guarded([&] {
        return client->client.stopReportingSessionForID(reporter_id, callbackFor<bool>(reply, context));
    });
}

bool tamblo_client_destroy_session(tamblo_client* client, int64_t reporter_id, tamblo_reply reply,
                                   void* context) {
    return guarded([&] {
        return client->client.destroyReportingSession(reporter_id, callbackFor<bool>(reply, context));
    });
}

bool tamblo_client_get_service_type(tamblo_client* client, int64_t reporter_id, tamblo_reply reply,
                                    void* context) {
    return guarded([&] {
        return client->client.getServiceNameForReporterID(reporter_id,
                                                          callbackFor<ServiceType>(reply, context));
    });
}
