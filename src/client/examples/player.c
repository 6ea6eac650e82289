/* A player that reports one session of playback, to the daemon at its usual place or at
 * the socket that the argument names.
 *
 *     cc player.c $(pkg-config --cflags --libs halyard) -o player
 */
#include <halyard/halyard.h>

int main(int argc, char** argv) {
    halyard_client* client = halyard_client_create(argc > 1 ? argv[1] : NULL);
    halyard_session* session = halyard_session_create(client, 0);
    halyard_dictionary* facts = halyard_dictionary_create(0);

    halyard_dictionary_set_string(facts, "HostApplicationDisplayID", "org.example.player");
    halyard_session_set_service_type(session, HALYARD_SERVICE_LONG_FORM_AUDIO);
    halyard_session_set_configuration(session, facts);
    halyard_session_start(session, NULL, NULL);

    halyard_dictionary_clear(facts);
    halyard_dictionary_set_uint(facts, "sample_rate", 48000);
    halyard_dictionary_set_string(facts, "route", "speaker");
    halyard_session_send(session, facts, HALYARD_CATEGORY_PLAYBACK, HALYARD_TYPE_START);
    /* ... play, until data comes too late once: ... */
    halyard_dictionary_clear(facts);
    halyard_dictionary_set_uint(facts, "buffered_frames", 0);
    halyard_issue underrun = {.size = sizeof(underrun), .category = HALYARD_CATEGORY_PLAYBACK};
    underrun.issue_type = "client_slow";
    underrun.rtaid_client = "org.example.player";
    underrun.node = "Example Player";
    underrun.any_channel_silence_seconds = 1.5;
    underrun.more = facts;
    halyard_session_report_issue(session, &underrun);
    /* ... and play on ... */
    halyard_session_stop(session, NULL, NULL);

    halyard_dictionary_destroy(facts);
    halyard_session_destroy(session);
    return halyard_client_destroy(client, 1000) == HALYARD_OK ? 0 : 1;
}
