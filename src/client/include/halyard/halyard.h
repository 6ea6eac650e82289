/* libhalyard: report what an audio process does to the halyard daemon.
 *
 * A client is one connection to the daemon, with a thread of its own behind it.
 * Sessions are made through it, typed, configured and started; messages are
 * dictionaries that are handed to it. Nothing here waits for the daemon: a call
 * puts its work in a bounded queue and returns, and the client's thread does the
 * rest, in the order of the calls. When the daemon goes away, the client
 * reconnects, makes its sessions again and goes on with what is queued.
 *
 *     halyard_client *client = halyard_client_create(NULL);
 *     halyard_session *session = halyard_session_create(client, 0);
 *     halyard_session_set_service_type(session, HALYARD_SERVICE_LONG_FORM_AUDIO);
 *     halyard_session_start(session, NULL, NULL);
 *
 *     halyard_dictionary *message = halyard_dictionary_create(0);
 *     halyard_dictionary_set_uint(message, "sample_rate", 48000);
 *     halyard_session_send(session, message, HALYARD_CATEGORY_PLAYBACK, HALYARD_TYPE_START);
 *
 * Threads: every function may be called from any thread; one dictionary is to
 * be used by one thread at a time. "Real-time safe" in a comment means: takes no
 * lock, allocates nothing, waits for nobody; at most it makes one system call to
 * wake the client's thread. Callbacks run on the client's thread, one at a time;
 * they may call everything but halyard_client_flush() and
 * halyard_client_destroy(), and should return soon.
 *
 * fork(): a client belongs to the process that made it. In a child its
 * connection is closed, every call answers HALYARD_FORKED, and destroying it
 * frees what can be freed; make a new one there.
 *
 * Text is UTF-8 and ends with a NUL. All functions tolerate NULL handles: they
 * answer HALYARD_INVALID and do nothing.
 */
#ifndef HALYARD_HALYARD_H
#define HALYARD_HALYARD_H

#include <stdbool.h>
#include <stddef.h>
#include <stdint.h>

#if defined(__GNUC__)
#define HALYARD_EXPORT __attribute__((visibility("default")))
#else
#define HALYARD_EXPORT
#endif

#ifdef __cplusplus
extern "C" {
#endif

typedef struct halyard_client halyard_client;
typedef struct halyard_session halyard_session;
typedef struct halyard_dictionary halyard_dictionary;

/* ---- Results ---------------------------------------------------------------- */

typedef enum halyard_result {
    HALYARD_OK = 0,         /* Accepted: queued, in order. */
    HALYARD_INVALID = 1,    /* A bad argument, or a dictionary that is not well formed. */
    HALYARD_QUEUE_FULL = 2, /* Dropped and counted: the queue's memory is used up. */
    HALYARD_TOO_LARGE = 3,  /* Dropped and counted: the daemon takes no such message. */
    HALYARD_CLOSED = 4,     /* The client has been destroyed. */
    HALYARD_FORKED = 5,     /* The client belongs to the parent process. */
    HALYARD_TIMED_OUT = 6,  /* Waited as long as it was told to. */
    HALYARD_NO_MEMORY = 7,
    HALYARD_MISUSE = 8 /* Called from a callback that may not call it. */
} halyard_result;

/* A short English text for `result`, never NULL; not to be freed. */
HALYARD_EXPORT const char* halyard_result_text(halyard_result result);

/* Why a request failed. Lives only during the callback. `domain` is the
 * daemon's ("com.kestrel.audio.reporting", "com.kestrel.halyard.ipc") or the
 * library's own, HALYARD_ERROR_DOMAIN. */
typedef struct halyard_error {
    const char* domain;
    int64_t code;
    const char* message;
} halyard_error;

#define HALYARD_ERROR_DOMAIN "com.kestrel.halyard.client"
/* The connection broke after the request was sent: its outcome is unknown. */
#define HALYARD_ERROR_CONNECTION_LOST 1
/* Given up unsent: the daemon stayed away and the queue had to be cut. */
#define HALYARD_ERROR_DISCARDED 2
/* The client was destroyed before the answer came. */
#define HALYARD_ERROR_CLOSED 3
/* The daemon answered with something else than this request's result. */
#define HALYARD_ERROR_BAD_ANSWER 4

/* ---- Vocabulary ------------------------------------------------------------- */

enum {
    HALYARD_SERVICE_GENERIC = 0,
    HALYARD_SERVICE_PARLO = 1,
    HALYARD_SERVICE_TELEPHONY = 2,
    HALYARD_SERVICE_HAPTICS = 3,
    HALYARD_SERVICE_ALARMS = 4,
    HALYARD_SERVICE_STANDALONE = 5,
    HALYARD_SERVICE_SOUND_AUTO_CONFIG = 6,
    HALYARD_SERVICE_LONG_FORM_AUDIO = 7,
    HALYARD_SERVICE_NON_LONG_FORM_AUDIO = 8,
    HALYARD_SERVICE_AUDIO_DEVICE_USAGE = 9,
    HALYARD_SERVICE_ALERTS = 10,
    HALYARD_SERVICE_TEST = 11,
    HALYARD_SERVICE_API_USAGE = 12,
    HALYARD_SERVICE_SYSTEM_SOUNDS = 13,
    HALYARD_SERVICE_UNKNOWN = 65535
};

enum {
    HALYARD_CATEGORY_GENERIC = 1,
    HALYARD_CATEGORY_RECORD = 2,
    HALYARD_CATEGORY_INPUT = 3,
    HALYARD_CATEGORY_PLAYBACK = 4,
    HALYARD_CATEGORY_OUTPUT = 5,
    HALYARD_CATEGORY_PLAYBACK_AND_RECORD = 6,
    HALYARD_CATEGORY_IO = 7,
    HALYARD_CATEGORY_SETUP = 8,
    HALYARD_CATEGORY_CLIENT_REQUEST = 9,
    HALYARD_CATEGORY_ROUTE_CHANGE = 10,
    HALYARD_CATEGORY_ERROR = 11,
    HALYARD_CATEGORY_HW_REPORTING = 12,
    HALYARD_CATEGORY_PERFORMANCE = 13,
    HALYARD_CATEGORY_VOLUME = 14,
    HALYARD_CATEGORY_HEARING_HEALTH = 15
};

/* Group flags, added to a category with "|". */
#define HALYARD_GROUP_MIDI UINT32_C(0x04000000)
#define HALYARD_GROUP_SESSION UINT32_C(0x08000000)
#define HALYARD_GROUP_DSP UINT32_C(0x10000000)
#define HALYARD_GROUP_HAL UINT32_C(0x20000000)
#define HALYARD_GROUP_ROUTING UINT32_C(0x40000000)
#define HALYARD_GROUP_TOOLBOX UINT32_C(0x80000000)

enum {
    HALYARD_TYPE_START = 1,
    HALYARD_TYPE_STOP = 2,
    HALYARD_TYPE_ACTIVATE = 3,
    HALYARD_TYPE_DEACTIVATE = 4,
    HALYARD_TYPE_SETUP = 5,
    HALYARD_TYPE_ERROR = 6,
    HALYARD_TYPE_ISSUE_DETECTOR = 7,
    HALYARD_TYPE_ENERGY_LEDGER = 8,
    HALYARD_TYPE_AUDIO_UNIT_USAGE = 9,
    HALYARD_TYPE_MIDI_DRIVER = 10,
    HALYARD_TYPE_SUMMARY = 11,
    HALYARD_TYPE_HEADPHONE_AUDIO_EXPOSURE = 12,
    HALYARD_TYPE_AUDIO_EXPOSURE = 13,
    HALYARD_TYPE_LISTENING_ENHANCEMENT = 14,
    HALYARD_TYPE_GAUGEWELL = 15,
    HALYARD_TYPE_SIMPLE = 16,
    HALYARD_TYPE_HISTOGRAM = 17,
    HALYARD_TYPE_STATE = 18,
    HALYARD_TYPE_UNKNOWN = 65535
};

/* ---- Dictionaries: messages and configurations ------------------------------ */

/* A dictionary is written front to back into a buffer of its own. Set a key
 * twice and the last value counts. Nested dictionaries and lists are opened by a
 * begin call and closed by halyard_dictionary_end(); in between, every set goes
 * into them. In a list, keys are ignored and may be NULL.
 *
 * Real-time safe as long as the contents fit into the capacity: so make it once,
 * and clear it before the next message. A mistake (no key, too deep, an end
 * without a begin, no memory) marks the dictionary as broken until it is cleared:
 * the set calls may go unchecked, sending it answers HALYARD_INVALID (or
 * HALYARD_NO_MEMORY). */

/* `capacity` in bytes, 0 for 2 KiB; it grows when needed, up to 1 MiB. The caller
 * owns the result. NULL when there is no memory. */
HALYARD_EXPORT halyard_dictionary* halyard_dictionary_create(size_t capacity);
HALYARD_EXPORT void halyard_dictionary_destroy(halyard_dictionary* dictionary);
/* Empties it and keeps its memory. */
HALYARD_EXPORT void halyard_dictionary_clear(halyard_dictionary* dictionary);

HALYARD_EXPORT halyard_result halyard_dictionary_set_string(halyard_dictionary* dictionary,
                                                            const char* key, const char* value);
/* `length` bytes at `value`, which need not end with a NUL. */
HALYARD_EXPORT halyard_result halyard_dictionary_set_text(halyard_dictionary* dictionary,
                                                          const char* key, const char* value,
                                                          size_t length);
HALYARD_EXPORT halyard_result halyard_dictionary_set_int(halyard_dictionary* dictionary,
                                                         const char* key, int64_t value);
HALYARD_EXPORT halyard_result halyard_dictionary_set_uint(halyard_dictionary* dictionary,
                                                          const char* key, uint64_t value);
HALYARD_EXPORT halyard_result halyard_dictionary_set_double(halyard_dictionary* dictionary,
                                                            const char* key, double value);
HALYARD_EXPORT halyard_result halyard_dictionary_set_float(halyard_dictionary* dictionary,
                                                           const char* key, float value);
HALYARD_EXPORT halyard_result halyard_dictionary_set_bool(halyard_dictionary* dictionary,
                                                          const char* key, bool value);
/* A moment in UTC: seconds since 1970 (may be negative) and, counted forward
 * from there, 0 to 999,999,999 nanoseconds. */
HALYARD_EXPORT halyard_result halyard_dictionary_set_date(halyard_dictionary* dictionary,
                                                          const char* key, int64_t seconds,
                                                          uint32_t nanoseconds);
HALYARD_EXPORT halyard_result halyard_dictionary_begin_dictionary(halyard_dictionary* dictionary,
                                                                  const char* key);
HALYARD_EXPORT halyard_result halyard_dictionary_begin_list(halyard_dictionary* dictionary,
                                                            const char* key);
HALYARD_EXPORT halyard_result halyard_dictionary_end(halyard_dictionary* dictionary);

/* ---- Client ------------------------------------------------------------------ */

typedef enum halyard_connection_state {
    HALYARD_DISCONNECTED = 0, /* Lost, or could not be made: told once, retried quietly. */
    HALYARD_CONNECTED = 1     /* Connected, and the sessions are made again. */
} halyard_connection_state;

typedef void (*halyard_connection_fn)(void* context, halyard_connection_state state);

/* Zero the struct, set `size`, then what you care for. */
typedef struct halyard_options {
    size_t size;             /* sizeof(halyard_options) */
    const char* socket_path; /* NULL: the daemon's usual place, see below. */
    /* The queue's memory in bytes, rounded down to a power of two, at least
     * 64 KiB; 0: 4 MiB. It is reserved at once and taken as it gets used. */
    size_t memory_limit;
    uint32_t retry_first_ms; /* Wait before the first reconnect, doubled each time; 0: 50. */
    uint32_t retry_last_ms;  /* Longest wait; 0: 5,000. */
    halyard_connection_fn connection_changed; /* May be NULL. */
    void* context;                            /* Handed to connection_changed. */
} halyard_options;

/* Makes a client and its thread; the connection comes about in the background,
 * also when the daemon starts later. The caller owns the result. NULL with errno
 * set when there is no memory, no thread, or the path is too long.
 *
 * `socket_path` NULL: reporting.sock is looked for, at each attempt, in
 * $RUNTIME_DIRECTORY if that is set, in $XDG_RUNTIME_DIR/halyard if that is set
 * and the process is not root's, and in /run/halyard. */
HALYARD_EXPORT halyard_client* halyard_client_create(const char* socket_path);
HALYARD_EXPORT halyard_client* halyard_client_create_with_options(const halyard_options* options);

/* Delivers what is queued, stops and destroys the sessions that are left, waits
 * for open answers, all that for `timeout_ms` at most; without a daemon it
 * returns at once. What is left is dropped and counted; open callbacks are called
 * with HALYARD_ERROR_CLOSED. No callback runs after it returned. Session handles
 * stay valid (they answer HALYARD_CLOSED) until they are destroyed.
 * HALYARD_TIMED_OUT when something was left; the client is gone all the same. */
HALYARD_EXPORT halyard_result halyard_client_destroy(halyard_client* client, uint32_t timeout_ms);

/* Waits until all that was queued before the call has been written to the
 * daemon, for `timeout_ms` at most. Blocks: not for audio threads. */
HALYARD_EXPORT halyard_result halyard_client_flush(halyard_client* client, uint32_t timeout_ms);

/* Messages, but for `reconnects` and the bytes. */
typedef struct halyard_statistics {
    size_t size;                 /* sizeof(halyard_statistics), set by the caller */
    uint64_t sent;               /* written to the daemon */
    uint64_t dropped_queue_full; /* refused: no room in the queue */
    uint64_t dropped_discarded;  /* given up unsent: the queue was cut, or the client destroyed */
    uint64_t dropped_too_large;  /* refused: larger than a frame (1 MiB) or the queue */
    uint64_t dropped_invalid;    /* refused: the dictionary was broken */
    uint64_t reconnects;         /* connections made after the first */
    uint64_t queued_bytes;       /* in the queue now */
    uint64_t memory_limit;       /* what queued_bytes can rise to */
} halyard_statistics;

/* Real-time safe. */
HALYARD_EXPORT halyard_result halyard_client_statistics(const halyard_client* client,
                                                        halyard_statistics* statistics);

/* ---- Requests ----------------------------------------------------------------- */

/* Where a request takes a callback, NULL means: no answer wanted, which spares
 * the daemon sending one. A callback is called exactly once when the call
 * answered HALYARD_OK, and never otherwise. `error` is NULL on success. */
typedef void (*halyard_done_fn)(void* context, const halyard_error* error);

/* ---- Sessions */

/* Makes a session under `reporter_id`, or under a random ID when that is 0. The
 * caller owns the result. NULL with errno set when there is no memory, no room in
 * the queue, or the client has too many sessions (65,536). */
HALYARD_EXPORT halyard_session* halyard_session_create(halyard_client* client, int64_t reporter_id);
/* Stops it if need be, destroys it at the daemon and frees the handle. */
HALYARD_EXPORT void halyard_session_destroy(halyard_session* session);
HALYARD_EXPORT int64_t halyard_session_reporter_id(const halyard_session* session);

/* To be set before the start. Real-time safe. */
HALYARD_EXPORT halyard_result halyard_session_set_service_type(halyard_session* session,
                                                               uint16_t service_type);
/* Adds the entries of `configuration` to the session's configuration. */
HALYARD_EXPORT halyard_result halyard_session_set_configuration(
    halyard_session* session, const halyard_dictionary* configuration);
/* The daemon answers a start when the session is stopped: `stopped`, if given, is
 * called then, however often the daemon was restarted in between. Real-time safe. */
HALYARD_EXPORT halyard_result halyard_session_start(halyard_session* session,
                                                    halyard_done_fn stopped, void* context);
/* Real-time safe. */
HALYARD_EXPORT halyard_result halyard_session_stop(halyard_session* session, halyard_done_fn done,
                                                   void* context);
/* Sends a message to this session. The dictionary is copied, and may be changed,
 * sent again or destroyed at once. "hyreporting_timestamp", "systemuptime_sec" and
 * "processuptime_ms" are added when it lacks them. Real-time safe. */
HALYARD_EXPORT halyard_result halyard_session_send(halyard_session* session,
                                                   const halyard_dictionary* message,
                                                   uint32_t category, uint16_t type);

/* ---- Sound that was missing */

/* An issue that the program itself saw: what it played ran out, what it recorded
 * was lost. Zero the struct, set `size`, then what you know. */
typedef struct halyard_issue {
    size_t size;              /* sizeof(halyard_issue) */
    uint32_t category;        /* HALYARD_CATEGORY_PLAYBACK or HALYARD_CATEGORY_RECORD */
    const char* issue_type;   /* What happened, say "client_slow"; neither NULL nor empty. */
    const char* rtaid_client; /* The application. May be NULL. */
    const char* node;         /* The stream. May be NULL. */
    double any_channel_silence_seconds; /* How long sound was missing: 0 to 2,147,483,647. */
    const halyard_dictionary* more;     /* Further entries of the message. May be NULL. */
} halyard_issue;

/* Sends `issue` to this session, as one message of type HALYARD_TYPE_ISSUE_DETECTOR
 * whose keys are the names of the four fields behind the category, and those of
 * `more`. Where `more` has one of the four itself, the field counts; a text that is
 * NULL is no field, so then `more` does, and else the key is missing. All is copied,
 * as halyard_session_send() does it, and the same stamps are added. Texts that are
 * no UTF-8 go as they are. Real-time safe.
 *
 * HALYARD_INVALID when there is another category, no issue_type, seconds that are
 * negative, too many or not a number, or a `more` that is not well formed.
 * HALYARD_TOO_LARGE when a text is longer than 1,024 bytes (no more than one byte
 * beyond is read), or the message than a frame. Both are counted. */
HALYARD_EXPORT halyard_result halyard_session_report_issue(halyard_session* session,
                                                           const halyard_issue* issue);

/* ---- Without a session */

/* Sends a message to the sessions with these IDs, of whatever client; to every
 * started session when `reporter_ids` is NULL. At most 4,096 IDs. */
HALYARD_EXPORT halyard_result halyard_client_send(halyard_client* client,
                                                  const halyard_dictionary* message,
                                                  uint32_t category, uint16_t type,
                                                  const int64_t* reporter_ids, size_t count,
                                                  halyard_done_fn done, void* context);

/* HALYARD_SERVICE_UNKNOWN when there is no such session. */
typedef void (*halyard_service_type_fn)(void* context, const halyard_error* error,
                                        uint16_t service_type);
HALYARD_EXPORT halyard_result halyard_client_get_service_type(halyard_client* client,
                                                              int64_t reporter_id,
                                                              halyard_service_type_fn answered,
                                                              void* context);

/* 0 and HALYARD_SERVICE_UNKNOWN when there is no such session. */
typedef void (*halyard_reporter_fn)(void* context, const halyard_error* error, int64_t reporter_id,
                                    uint16_t service_type);
HALYARD_EXPORT halyard_result halyard_client_reporter_valid(halyard_client* client,
                                                            int64_t reporter_id,
                                                            halyard_reporter_fn answered,
                                                            void* context);

/* The IDs of all sessions of all clients; they live only during the callback. */
typedef void (*halyard_reporters_fn)(void* context, const halyard_error* error,
                                     const int64_t* reporter_ids, size_t count);
HALYARD_EXPORT halyard_result halyard_client_get_all_reporters(halyard_client* client,
                                                               halyard_reporters_fn answered,
                                                               void* context);

/* Ends the daemon at once (own uid, root and administrators only). It sends no
 * answer: on success `refused` hears HALYARD_ERROR_CONNECTION_LOST. */
HALYARD_EXPORT halyard_result halyard_client_kill_service(halyard_client* client,
                                                          halyard_done_fn refused, void* context);

/* ---- Kernel trace marks ------------------------------------------------------ */

/* A place to put a uprobe on: does nothing (3 ns), begins with a nop, and has its
 * arguments in the argument registers. Also there as the USDT probe
 * halyard:evmark_trace. Needs no client. Real-time safe. */
HALYARD_EXPORT void evmark_trace(uint32_t code, uint64_t arg1, uint64_t arg2, uint64_t arg3,
                                 uint64_t arg4);

#ifdef __cplusplus
}
#endif

#endif /* HALYARD_HALYARD_H */
