#include "client/tamblo.h"

typedef struct {
    int replies;
    int errors;
    int64_t last_result;
    int connected;
} Seen;

static void on_reply(void* context, const tamblo_error* error, int64_t result) {
    Seen* seen = context;
    seen->replies += 1;
    seen->errors += error != NULL;
    seen->last_result = result;
}

static void on_state(void* context, tamblo_state state) {
    Seen* seen = context;
    seen->connected += state == TAMBLO_CONNECTED;
}

static bool run_session(tamblo_client* client, Seen* seen) {
    static const unsigned char bytes[] = {0, 1, 255};
    const int64_t reporters[] = {7};
    tamblo_payload* payload = tamblo_payload_create();
    tamblo_payload_set_string(NULL, "nowhere", "x");
    tamblo_payload_set_string(payload, "gone", "x");
    tamblo_payload_clear(payload);
    tamblo_payload_set_string(payload, "string", "text");
    tamblo_payload_set_int(payload, "int", -5);
    tamblo_payload_set_uint(payload, "uint", UINT64_MAX);
    tamblo_payload_set_double(payload, "double", 0.1);
    tamblo_payload_set_float(payload, "float", 0.5f);
    tamblo_payload_set_bool(payload, "bool", true);
    tamblo_payload_set_date(payload, "date", 1.5);
    tamblo_payload_set_data(payload, "data", bytes, sizeof bytes);
    tamblo_payload* inner = tamblo_payload_create();
    tamblo_payload_set_ints(inner, "ints", reporters, 1);
    tamblo_payload_set_doubles(inner, "doubles", &(const double){0.5}, 1);
    tamblo_payload_set_strings(inner, "strings", (const char* const[]){"a", "b"}, 2);
    tamblo_payload_set_payload(payload, "inner", inner);
    tamblo_payload_destroy(inner);
    const bool is_queued =
        tamblo_client_create_session(client, 7, on_reply, seen) &&
        tamblo_client_set_service_type(client, TAMBLO_SERVICE_LONG_FORM_AUDIO, 7, on_reply, seen) &&
        tamblo_client_set_configuration(client, payload, 7, on_reply, seen) &&
        tamblo_client_start_session(client, 7, on_reply, seen) &&
        tamblo_client_send(client, payload, TAMBLO_SUBSYSTEM_SESSION | TAMBLO_KIND_PLAYBACK,
                           TAMBLO_TYPE_START, reporters, 1, on_reply, seen) &&
        tamblo_client_send(client, payload, TAMBLO_KIND_VOLUME, TAMBLO_TYPE_GENERIC, NULL, 0, NULL, NULL) &&
        tamblo_client_send(client, NULL, TAMBLO_KIND_VOLUME, TAMBLO_TYPE_GENERIC, NULL, 0, NULL, NULL) &&
        tamblo_client_stop_session(client, 7, on_reply, seen) &&
        tamblo_client_destroy_session(client, 7, NULL, NULL) &&
        tamblo_client_get_service_type(client, 7, on_reply, seen);
    tamblo_payload_destroy(payload);
    return is_queued;
}

/* Whether waiting ends when it should though no service is there: after its time, or with errors. */
static bool waits_without_service(tamblo_threading threading) {
    Seen seen = {0};
    tamblo_options options = {.socket_path = "/nonexistent/socket", .threading = threading};
    tamblo_client* client = tamblo_client_create(&options);
    const bool is_late =
        tamblo_client_create_session(client, 7, on_reply, &seen) && !tamblo_client_wait(client, 20);
    tamblo_client_destroy(client);
    options.no_reconnect = true;
    client = tamblo_client_create(&options);
    const bool is_refused =
        tamblo_client_create_session(client, 7, on_reply, &seen) && tamblo_client_wait(client, 5000);
    tamblo_client_destroy(client);
    return is_late && is_refused && seen.errors == 2;
}

/* Does everything that the C header offers. 0, or the line of the first step that failed. */
int runCProgram(const char* socket_path) {
    Seen seen = {0};
    tamblo_options options = {.socket_path = socket_path};
    tamblo_client* client = tamblo_client_create(&options); /* with a thread of its own */
    /* The start is answered by nobody, and not waited for. */
    if (!tamblo_client_create_session(client, 7, on_reply, &seen) ||
        !tamblo_client_start_session(client, 7, on_reply, &seen) || !tamblo_client_wait(client, 5000))
        return __LINE__;
    if (seen.replies != 1 || seen.errors != 0)
        return __LINE__;
    tamblo_client_destroy(client);

    seen = (Seen){0};
    options.threading = TAMBLO_CALLER;
    options.state_changed = on_state;
    options.context = &seen;
    client = tamblo_client_create(&options);
    if (!tamblo_client_connect(client) || !tamblo_client_is_connected(client) || !run_session(client, &seen))
        return __LINE__;
    if (!tamblo_client_wait(client, 5000) || seen.replies != 6 || seen.errors != 0 || seen.last_result != 7 ||
        seen.connected != 1)
        return __LINE__;
    if (!tamblo_client_flush(client, 5000) || tamblo_client_refused_messages(client) != 0)
        return __LINE__;
    tamblo_client_destroy(client);
    if (!waits_without_service(TAMBLO_BACKGROUND) || !waits_without_service(TAMBLO_CALLER))
        return __LINE__;
    return seen.replies == 7 && seen.errors == 1 ? 0 : __LINE__; /* the start was never answered */
}
