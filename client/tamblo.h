#pragma once

#include <stdbool.h>
#include <stddef.h>
#include <stdint.h>

/*
 * The client library for C, and for languages that bind to C.
 *
 * Sending never blocks: a request is copied into a bounded queue, and refused and counted when that is full.
 * Functions that return bool answer whether it was queued. Texts are UTF-8, end with a zero byte, and are
 * copied. Callbacks run on the library's thread (TAMBLO_BACKGROUND) or inside tamblo_client_run
 * (TAMBLO_CALLER), get what they point to for the time of the call, may send, and must not run or destroy the
 * client. A null callback asks for no reply.
 *
 * With TAMBLO_BACKGROUND any thread may call the functions of a client, but for tamblo_client_destroy, after
 * which none may; with TAMBLO_CALLER one thread does. A payload is used by one thread at a time. The requests
 * reporterID, getAllReporters and killService are in C++ only.
 */

#ifdef __cplusplus
extern "C" {
#endif

typedef struct tamblo_client tamblo_client;
typedef struct tamblo_payload tamblo_payload;

typedef enum { TAMBLO_BACKGROUND = 0, TAMBLO_CALLER = 1 } tamblo_threading;
typedef enum { TAMBLO_CONNECTED = 0, TAMBLO_LOST = 1, TAMBLO_RECONNECTING = 2 } tamblo_state;

/*
 * What came instead of a result: what the service said, or, with the domain TAMBLO_ERROR_DOMAIN, why its
 * answer will not come; the code is then one of tamblo_error_code.
 */
typedef struct {
    const char* domain;
    int64_t code;
    const char* message;
} tamblo_error;

#define TAMBLO_ERROR_DOMAIN "com.vandra.tamblo.client"

typedef enum {
    TAMBLO_ERROR_CONNECTION_LOST = 1,  /* it was sent; whether it was carried out is not known */
    TAMBLO_ERROR_REFUSED = 2,          /* it was not sent: the queue was full, or it was too long */
    TAMBLO_ERROR_CLOSED = 3,           /* the client was destroyed first */
    TAMBLO_ERROR_UNEXPECTED_REPLY = 4, /* the service answered with another kind of result */
    TAMBLO_ERROR_TOO_MANY_PENDING = 5  /* it was not sent: a million requests are unanswered */
} tamblo_error_code;

/*
 * The numbers of the protocol that have names; another may be sent all the same. A category is one of the
 * kinds, alone or with the part of the audio stack that reports: TAMBLO_SUBSYSTEM_SESSION |
 * TAMBLO_KIND_PLAYBACK.
 */
#define TAMBLO_SUBSYSTEM_MIDI UINT32_C(0x04000000)
#define TAMBLO_SUBSYSTEM_SESSION UINT32_C(0x08000000)
#define TAMBLO_SUBSYSTEM_DSP UINT32_C(0x10000000)
#define TAMBLO_SUBSYSTEM_HAL UINT32_C(0x20000000)
#define TAMBLO_SUBSYSTEM_ROUTING UINT32_C(0x40000000)
#define TAMBLO_SUBSYSTEM_TOOLBOX UINT32_C(0x80000000)

typedef enum {
    TAMBLO_KIND_GENERIC = 1,
    TAMBLO_KIND_RECORD = 2,
    TAMBLO_KIND_INPUT = 3,
    TAMBLO_KIND_PLAYBACK = 4,
    TAMBLO_KIND_OUTPUT = 5,
    TAMBLO_KIND_PLAYBACK_AND_RECORD = 6,
    TAMBLO_KIND_IO = 7,
    TAMBLO_KIND_SETUP = 8,
    TAMBLO_KIND_CLIENT_REQUEST = 9,
    TAMBLO_KIND_ROUTE_CHANGE = 10,
    TAMBLO_KIND_ERROR = 11,
    TAMBLO_KIND_CHANLOG = 12,
    TAMBLO_KIND_PERFORMANCE = 13,
    TAMBLO_KIND_VOLUME = 14,
    TAMBLO_KIND_KALEEN = 15,
    TAMBLO_KIND_HEARING_HEALTH = 16,
    TAMBLO_KIND_WIRRELS = 17
} tamblo_event_kind;

typedef enum {
    TAMBLO_TYPE_GENERIC = 0,
    TAMBLO_TYPE_START = 1,
    TAMBLO_TYPE_STOP = 2,
    TAMBLO_TYPE_ACTIVATE = 3,
    TAMBLO_TYPE_DEACTIVATE = 4,
    TAMBLO_TYPE_SETUP = 5,
    TAMBLO_TYPE_ERROR = 6,
    TAMBLO_TYPE_ISSUE_DETECTOR = 7,
    TAMBLO_TYPE_JOULERY = 8,
    TAMBLO_TYPE_AUDIO_UNIT_USAGE = 9,
    TAMBLO_TYPE_MIDI_DRIVER = 10,
    TAMBLO_TYPE_SUMMARY = 11,
    TAMBLO_TYPE_HEADPHONE_AUDIO_EXPOSURE = 12,
    TAMBLO_TYPE_AUDIO_EXPOSURE = 13,
    TAMBLO_TYPE_LISTENING_ENHANCEMENT = 14,
    TAMBLO_TYPE_PULSEDECK = 15,
    TAMBLO_TYPE_SIMPLE = 16,
    TAMBLO_TYPE_HISTOGRAM = 17,
    TAMBLO_TYPE_STATE = 18,
    TAMBLO_TYPE_MEMORY_LOG = 19,
    TAMBLO_TYPE_UNKNOWN = 65535
} tamblo_event_type;

typedef enum {
    TAMBLO_SERVICE_GENERIC = 0,
    TAMBLO_SERVICE_VELKA = 1,
    TAMBLO_SERVICE_TELEPHONY = 2,
    TAMBLO_SERVICE_HAPTICS = 3,
    TAMBLO_SERVICE_ALARMS = 4,
    TAMBLO_SERVICE_STANDALONE = 5,
    TAMBLO_SERVICE_SOUND_AUTO_CONFIG = 6,
    TAMBLO_SERVICE_LONG_FORM_AUDIO = 7,
    TAMBLO_SERVICE_NON_LONG_FORM_AUDIO = 8,
    TAMBLO_SERVICE_AUDIO_DEVICE_USAGE = 9,
    TAMBLO_SERVICE_ALERTS = 10,
    TAMBLO_SERVICE_TEST = 11,
    TAMBLO_SERVICE_API_USAGE = 12,
    TAMBLO_SERVICE_SYSTEM_SOUNDS = 13,
    TAMBLO_SERVICE_UNKNOWN = 65535
} tamblo_service_type;

/* The error is null when there is none; the result then counts. */
typedef void (*tamblo_reply)(void* context, const tamblo_error* error, int64_t result);
typedef void (*tamblo_state_changed)(void* context, tamblo_state state);

typedef struct {
    const char* socket_path; /* null: the service's usual place */
    tamblo_threading threading;
    size_t queue_capacity; /* 0: 1,024 requests */
    bool no_reconnect;
    tamblo_state_changed state_changed; /* may be null; sessions are to be made anew at TAMBLO_CONNECTED */
    void* context;                      /* handed to state_changed */
} tamblo_options;

/* Null options: all as it comes. Null when there is no memory or no thread to be had. */
tamblo_client* tamblo_client_create(const tamblo_options* options);
/* Sends what is queued for at most a second, answers what waits with an error, and frees. */
void tamblo_client_destroy(tamblo_client* client);
/* Whether there is a connection at the moment. */
bool tamblo_client_is_connected(const tamblo_client* client);
/* Requests that were not queued: the queue was full, or they were longer than the service accepts. */
uint64_t tamblo_client_refused_messages(const tamblo_client* client);
/* Whether all that was queued left within this time. */
bool tamblo_client_flush(tamblo_client* client, int timeout_ms);
/*
 * Whether every request with a callback has been answered, at the latest after this time; but for starts,
 * which are answered when their session stops. With TAMBLO_CALLER it sends and receives meanwhile. An error
 * is an answer too: without no_reconnect, requests wait for a service that is not there. Not to be called
 * from a callback.
 */
bool tamblo_client_wait(tamblo_client* client, int timeout_ms);
/* TAMBLO_CALLER: connects at once; sends, receives and calls back, and returns the number of replies handled.
 */
bool tamblo_client_connect(tamblo_client* client);
size_t tamblo_client_run(tamblo_client* client, int timeout_ms);

/*
 * A payload or a configuration: keys with values, each set again replaces the former. May be sent many times.
 * A null one, which tamblo_payload_create answers when there is no memory, is empty, and stays so.
 */
tamblo_payload* tamblo_payload_create(void);
void tamblo_payload_destroy(tamblo_payload* payload);
void tamblo_payload_clear(tamblo_payload* payload);
void tamblo_payload_set_string(tamblo_payload* payload, const char* key, const char* value);
void tamblo_payload_set_int(tamblo_payload* payload, const char* key, int64_t value);
void tamblo_payload_set_uint(tamblo_payload* payload, const char* key, uint64_t value);
void tamblo_payload_set_double(tamblo_payload* payload, const char* key, double value);
void tamblo_payload_set_float(tamblo_payload* payload, const char* key, float value);
void tamblo_payload_set_bool(tamblo_payload* payload, const char* key, bool value);
/* Seconds since 1970. */
void tamblo_payload_set_date(tamblo_payload* payload, const char* key, double seconds);
/* Bytes, which are copied. */
void tamblo_payload_set_data(tamblo_payload* payload, const char* key, const void* bytes, size_t length);
/* Arrays, and another payload as a value, which is copied. */
void tamblo_payload_set_strings(tamblo_payload* payload, const char* key, const char* const* values,
                                size_t count);
void tamblo_payload_set_ints(tamblo_payload* payload, const char* key, const int64_t* values, size_t count);
void tamblo_payload_set_doubles(tamblo_payload* payload, const char* key, const double* values, size_t count);
void tamblo_payload_set_payload(tamblo_payload* payload, const char* key, const tamblo_payload* value);

/* A message to these reporters; without any, to every started session of every client, or, when none is
   started, to the service's single-message session. */
bool tamblo_client_send(tamblo_client* client, const tamblo_payload* payload, uint32_t category,
                        uint16_t type, const int64_t* reporter_ids, size_t reporter_count, tamblo_reply reply,
                        void* context);

/* Sessions. The result is 1 for true; a start is answered when the session stops, or never. */
bool tamblo_client_create_session(tamblo_client* client, int64_t reporter_id, tamblo_reply reply,
                                  void* context);
bool tamblo_client_set_service_type(tamblo_client* client, uint16_t service_type, int64_t reporter_id,
                                    tamblo_reply reply, void* context);
bool tamblo_client_set_configuration(tamblo_client* client, const tamblo_payload* configuration,
                                     int64_t reporter_id, tamblo_reply reply, void* context);
bool tamblo_client_start_session(tamblo_client* client, int64_t reporter_id, tamblo_reply reply,
                                 void* context);
bool tamblo_client_stop_session(tamblo_client* client, int64_t reporter_id, tamblo_reply reply,
                                void* context);
bool tamblo_client_destroy_session(tamblo_client* client, int64_t reporter_id, tamblo_reply reply,
                                   void* context);
/* The result is the service type, 65535 when the reporter is unknown. */
bool tamblo_client_get_service_type(tamblo_client* client, int64_t reporter_id, tamblo_reply reply,
                                    void* context);

#ifdef __cplusplus
}
#endif
