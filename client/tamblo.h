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

typedef struct {
    const char* domain;
    int64_t code;
    const char* message;
} tamblo_error;

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
bool tamblo_client_is_connected(const tamblo_client* client);
uint64_t tamblo_client_refused_messages(const tamblo_client* client);
/* Whether all that was queued left within this time. */
bool tamblo_client_flush(tamblo_client* client, int timeout_ms);
/* TAMBLO_CALLER: connects at once; sends, receives and calls back, and returns the number of replies handled.
 */
bool tamblo_client_connect(tamblo_client* client);
size_t tamblo_client_run(tamblo_client* client, int timeout_ms);

/* A payload or a configuration: keys with values, each set again replaces the former. May be sent many times.
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
void tamblo_payload_set_data(tamblo_payload* payload, const char* key, const void* bytes, size_t length);

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
