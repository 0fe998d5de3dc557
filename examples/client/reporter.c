/*
 * A player that reports a session in C: that it started, that somebody turned it up, that it stopped.
 *
 *     cc reporter.c $(pkg-config --cflags --libs tamblo) -o reporter && ./reporter
 *
 * It says what is wrong and ends, within seconds, where no service answers.
 */
#include <tamblo/client/tamblo.h>

#include <stdio.h>
#include <time.h>

enum { REPORTER = 7, PATIENCE_MS = 5000 };

static void on_reply(void* failed, const tamblo_error* error, int64_t result) {
    (void)result;
    if (error != NULL) {
        fprintf(stderr, "reporter: %s %lld: %s\n", error->domain, (long long)error->code, error->message);
        *(bool*)failed = true;
    }
}

/* The session's messages, each with the time of what it tells of, in seconds since 1970. */
static void report(tamblo_client* client, bool* failed) {
    const double began = (double)time(NULL) - 12.5;
    static const int64_t reporters[] = {REPORTER};
    static const char* const options[] = {"AllowBluetooth", "AllowAirPlay"};
    tamblo_payload* payload = tamblo_payload_create();
    tamblo_payload_set_double(payload, "zrreporting_timestamp", began);
    tamblo_payload_set_string(payload, "active_devices", "Speaker");
    tamblo_payload_set_bool(payload, "session_output_running", true);
    tamblo_payload_set_double(payload, "QVSessionVolume", 0.5);
    tamblo_payload_set_strings(payload, "options", options, 2);
    tamblo_client_send(client, payload, TAMBLO_SUBSYSTEM_SESSION | TAMBLO_KIND_PLAYBACK, TAMBLO_TYPE_START,
                       reporters, 1, on_reply, failed);

    tamblo_payload_clear(payload);
    tamblo_payload_set_double(payload, "zrreporting_timestamp", began + 5.0);
    tamblo_payload_set_double(payload, "QVSessionVolume", 0.75);
    tamblo_client_send(client, payload, TAMBLO_KIND_VOLUME, TAMBLO_TYPE_GENERIC, reporters, 1, on_reply,
                       failed);

    tamblo_payload_clear(payload);
    tamblo_payload_set_double(payload, "zrreporting_timestamp", began + 12.5);
    tamblo_payload_set_bool(payload, "session_output_running", false);
    tamblo_payload_set_double(payload, "session_duration", 12.5);
    tamblo_client_send(client, payload, TAMBLO_SUBSYSTEM_SESSION | TAMBLO_KIND_PLAYBACK, TAMBLO_TYPE_STOP,
                       reporters, 1, on_reply, failed);
    tamblo_payload_destroy(payload);
}

int main(void) {
    bool failed = false;
    const tamblo_options options = {.no_reconnect = true};
    tamblo_client* client = tamblo_client_create(&options);
    if (client == NULL) {
        return 1;
    }
    tamblo_client_create_session(client, REPORTER, on_reply, &failed);
    tamblo_client_set_service_type(client, TAMBLO_SERVICE_LONG_FORM_AUDIO, REPORTER, on_reply, &failed);
    tamblo_client_start_session(client, REPORTER, NULL, NULL);
    report(client, &failed);
    tamblo_client_stop_session(client, REPORTER, on_reply, &failed);

    if (!tamblo_client_wait(client, PATIENCE_MS)) {
        fputs("reporter: the service did not answer in time\n", stderr);
        failed = true;
    }
    tamblo_client_destroy(client);
    return failed ? 1 : 0;
}
