#ifndef HALVOX_H
#define HALVOX_H

/* The client of the Halvox reporting service, for C.
 *
 *   halvox_client *client = halvox_client_new(NULL);
 *   halvox_client_create_session(client, 7);
 *   halvox_client_set_service_type(client, 7, HALVOX_SERVICE_LONGFORMAUDIO);
 *   halvox_client_start(client, 7);
 *
 *   halvox_dictionary *message = halvox_dictionary_new();
 *   halvox_dictionary_set_double(message, "sample_rate", 48000.0);
 *   halvox_client_send(client, 7, message, HALVOX_DOMAIN_SESSION | HALVOX_CATEGORY_PLAYBACK,
 *                      HALVOX_EVENT_START);
 *   halvox_dictionary_free(message);
 *   ...
 *   halvox_client_free(client);
 *
 * A client has one thread of its own that does all the talking. When the service goes away it waits
 * for it to come back, connects again and makes its sessions again; messages wait meanwhile, up to
 * the bounds in the options. A client does not work in a process that was forked off its own.
 *
 * Threads: any thread may use a client, except that halvox_client_free() must be the last to.
 * A dictionary or an array may be read by several threads at once (sending it is reading), but be
 * changed by one only, while no other reads it.
 *
 * Ownership: what a function named ..._new gives is released with the ..._free of the same kind,
 * which takes NULL too. Everything else that is handed to a function is copied before it returns;
 * for dictionaries and arrays that is a reference count, not their content.
 *
 * Texts end with a NUL and are UTF-8. */

#include <stdbool.h>
#include <stddef.h>
#include <stdint.h>

#ifdef __cplusplus
extern "C" {
#endif

#if defined(__GNUC__)
#define HALVOX_API __attribute__((visibility("default")))
#else
#define HALVOX_API
#endif

typedef struct halvox_client halvox_client;
typedef struct halvox_dictionary halvox_dictionary;
typedef struct halvox_array halvox_array;

typedef enum halvox_result {
  HALVOX_OK = 0,
  HALVOX_DROPPED = 1,      /* the message was not taken: too much is waiting; it is counted */
  HALVOX_TIMED_OUT = 2,    /* the time was up first */
  HALVOX_BAD_ARGUMENT = 3, /* NULL where something is needed, or a text that is not UTF-8 */
  HALVOX_NO_MEMORY = 4
} halvox_result;

/* A few words on a result; never NULL. */
HALVOX_API const char* halvox_result_text(halvox_result result);

/* ---- The numbers of the protocol ------------------------------------------------------------ */

/* A category is one of these, or one of these and a domain together (|). */
enum {
  HALVOX_CATEGORY_GENERIC = 1,
  HALVOX_CATEGORY_RECORD = 2,
  HALVOX_CATEGORY_INPUT = 3,
  HALVOX_CATEGORY_PLAYBACK = 4,
  HALVOX_CATEGORY_OUTPUT = 5,
  HALVOX_CATEGORY_PLAYBACK_AND_RECORD = 6,
  HALVOX_CATEGORY_IO = 7,
  HALVOX_CATEGORY_SETUP = 8,
  HALVOX_CATEGORY_CLIENT_REQUEST = 9,
  HALVOX_CATEGORY_ROUTE_CHANGE = 10,
  HALVOX_CATEGORY_ERROR = 11,
  HALVOX_CATEGORY_IO_REPORTING = 12,
  HALVOX_CATEGORY_PERFORMANCE = 13,
  HALVOX_CATEGORY_VOLUME = 14,
  HALVOX_CATEGORY_HEARING_HEALTH = 15
};

/* No enumeration: in C its constants are signed and the last of these does not fit. */
#define HALVOX_DOMAIN_MIDI UINT32_C(0x04000000)
#define HALVOX_DOMAIN_SESSION UINT32_C(0x08000000)
#define HALVOX_DOMAIN_DSP UINT32_C(0x10000000)
#define HALVOX_DOMAIN_HAL UINT32_C(0x20000000)
#define HALVOX_DOMAIN_ROUTING UINT32_C(0x40000000)
#define HALVOX_DOMAIN_TOOLBOX UINT32_C(0x80000000)

enum {
  HALVOX_EVENT_START = 1,
  HALVOX_EVENT_STOP = 2,
  HALVOX_EVENT_ACTIVATE = 3,
  HALVOX_EVENT_DEACTIVATE = 4,
  HALVOX_EVENT_SETUP = 5,
  HALVOX_EVENT_ERROR = 6,
  HALVOX_EVENT_ISSUE_DETECTOR = 7,
  HALVOX_EVENT_JOULEBOOK = 8,
  HALVOX_EVENT_AUDIO_UNIT_USAGE = 9,
  HALVOX_EVENT_MIDI_DRIVER = 10,
  HALVOX_EVENT_SUMMARY = 11,
  HALVOX_EVENT_HEADPHONE_AUDIO_EXPOSURE = 12,
  HALVOX_EVENT_AUDIO_EXPOSURE = 13,
  HALVOX_EVENT_LISTENINGENHANCEMENT = 14,
  HALVOX_EVENT_DORVAN = 15,
  HALVOX_EVENT_SIMPLE = 16,
  HALVOX_EVENT_HISTOGRAM = 17,
  HALVOX_EVENT_STATE = 18,
  HALVOX_EVENT_UNKNOWN = 65535
};

enum {
  HALVOX_SERVICE_GENERIC = 0,
  HALVOX_SERVICE_QUILLO = 1,
  HALVOX_SERVICE_TELEPHONY = 2,
  HALVOX_SERVICE_HAPTICS = 3,
  HALVOX_SERVICE_ALARMS = 4,
  HALVOX_SERVICE_STANDALONE = 5,
  HALVOX_SERVICE_SOUNDAUTOCONFIG = 6,
  HALVOX_SERVICE_LONGFORMAUDIO = 7,
  HALVOX_SERVICE_NONLONGFORMAUDIO = 8,
  HALVOX_SERVICE_AUDIODEVICEUSAGE = 9,
  HALVOX_SERVICE_ALERTS = 10,
  HALVOX_SERVICE_TEST = 11,
  HALVOX_SERVICE_APIUSAGE = 12,
  HALVOX_SERVICE_SYSTEMSOUNDS = 13,
  HALVOX_SERVICE_UNKNOWN = 65535
};

/* The name of a category, such as "Session_Playback", into a buffer that snprintf() would fill:
 * what has no room is cut off, and the full length is returned. A size of 0 only measures. */
HALVOX_API size_t halvox_category_name(uint32_t category, char* buffer, size_t size);
/* The names of the others; they live as long as the program. */
HALVOX_API const char* halvox_event_type_name(uint16_t type);
HALVOX_API const char* halvox_service_type_name(uint16_t type);

/* The number of a name, in any case of letters; false, and nothing stored, for an unknown one. */
HALVOX_API bool halvox_find_category(const char* name, uint32_t* category);
HALVOX_API bool halvox_find_event_type(const char* name, uint16_t* type);
HALVOX_API bool halvox_find_service_type(const char* name, uint16_t* type);

/* ---- Values --------------------------------------------------------------------------------- */

/* An empty dictionary; NULL without memory. */
HALVOX_API halvox_dictionary* halvox_dictionary_new(void);
HALVOX_API void halvox_dictionary_free(halvox_dictionary* dictionary);
HALVOX_API size_t halvox_dictionary_count(const halvox_dictionary* dictionary);

/* Each sets the value under a key, in the place of an old one. On failure nothing is changed.
 * A date counts the seconds since 1970-01-01 00:00 UTC. */
HALVOX_API halvox_result halvox_dictionary_set_int64(halvox_dictionary* dictionary, const char* key,
                                                     int64_t value);
HALVOX_API halvox_result halvox_dictionary_set_uint64(halvox_dictionary* dictionary,
                                                      const char* key, uint64_t value);
HALVOX_API halvox_result halvox_dictionary_set_double(halvox_dictionary* dictionary,
                                                      const char* key, double value);
HALVOX_API halvox_result halvox_dictionary_set_bool(halvox_dictionary* dictionary, const char* key,
                                                    bool value);
HALVOX_API halvox_result halvox_dictionary_set_string(halvox_dictionary* dictionary,
                                                      const char* key, const char* value);
HALVOX_API halvox_result halvox_dictionary_set_data(halvox_dictionary* dictionary, const char* key,
                                                    const void* bytes, size_t size);
HALVOX_API halvox_result halvox_dictionary_set_date(halvox_dictionary* dictionary, const char* key,
                                                    double seconds_since_1970);
/* The inner one is taken as it is now: changing it later changes nothing in the outer one. */
HALVOX_API halvox_result halvox_dictionary_set_dictionary(halvox_dictionary* dictionary,
                                                          const char* key,
                                                          const halvox_dictionary* value);
HALVOX_API halvox_result halvox_dictionary_set_array(halvox_dictionary* dictionary, const char* key,
                                                     const halvox_array* value);
/* False when there was no such key. */
HALVOX_API bool halvox_dictionary_remove(halvox_dictionary* dictionary, const char* key);

/* An empty array; NULL without memory. */
HALVOX_API halvox_array* halvox_array_new(void);
HALVOX_API void halvox_array_free(halvox_array* array);
HALVOX_API size_t halvox_array_count(const halvox_array* array);
/* Each appends one value. */
HALVOX_API halvox_result halvox_array_append_int64(halvox_array* array, int64_t value);
HALVOX_API halvox_result halvox_array_append_uint64(halvox_array* array, uint64_t value);
HALVOX_API halvox_result halvox_array_append_double(halvox_array* array, double value);
HALVOX_API halvox_result halvox_array_append_bool(halvox_array* array, bool value);
HALVOX_API halvox_result halvox_array_append_string(halvox_array* array, const char* value);
HALVOX_API halvox_result halvox_array_append_data(halvox_array* array, const void* bytes,
                                                  size_t size);
HALVOX_API halvox_result halvox_array_append_date(halvox_array* array, double seconds_since_1970);
HALVOX_API halvox_result halvox_array_append_dictionary(halvox_array* array,
                                                        const halvox_dictionary* value);
HALVOX_API halvox_result halvox_array_append_array(halvox_array* array, const halvox_array* value);

/* ---- The client ----------------------------------------------------------------------------- */

/* How a client works. Set `size` to sizeof(halvox_options) and the rest to 0 for the defaults;
 * fields that a later version adds are then defaults too. */
typedef struct halvox_options {
  size_t size;
  const char* socket_path;       /* NULL: the usual places, see below */
  uint64_t max_pending_messages; /* what may wait for the client's thread; 0: 8192 */
  uint64_t max_pending_bytes;    /* 0: 8 MiB */
  uint32_t request_timeout_ms;   /* how long making a connection may take; 0: 5000 */
  uint32_t reconnect_min_ms;     /* first and longest pause between attempts to connect; */
  uint32_t reconnect_max_ms;     /* 0: 50 and 2000 */
} halvox_options;

/* What became of the messages: accepted = acknowledged + refused + lost + pending. */
typedef struct halvox_counters {
  size_t size;           /* set it to sizeof(halvox_counters) before the call */
  uint64_t accepted;     /* taken by a send */
  uint64_t dropped;      /* not taken */
  uint64_t acknowledged; /* answered by the service */
  uint64_t refused;      /* answered with an error, or without a form on the wire */
  uint64_t lost;         /* in flight when a connection ended: the service may have had them */
  uint64_t pending;      /* waiting or in flight */
  uint64_t reconnects;
} halvox_counters;

/* Called on the client's thread. It must not call halvox_client_free(). */
typedef void (*halvox_connection_handler)(bool connected, void* user_data);

/* Where a client with default options looks for the service now: $HALVOX_SOCKET when it is set,
 * else the user's place, $XDG_RUNTIME_DIR/halvox/reporting.sock, when that exists, else the
 * system's, /run/halvox/reporting.sock, when that exists, else the first of these that is set. A
 * client goes on to the next place when nobody serves a socket, and looks again at each attempt;
 * one whose connection ended waits for 10 seconds at the same place before it looks elsewhere.
 * Fills the buffer as halvox_category_name() does. */
HALVOX_API size_t halvox_default_socket_path(char* buffer, size_t size);

/* Starts a client, at once and whether there is a service or not. NULL for the options: all
 * defaults. NULL comes back when there is no memory or no thread to be had. */
HALVOX_API halvox_client* halvox_client_new(const halvox_options* options);
/* Delivers what is pending for at most a second, then ends the client and its sessions. */
HALVOX_API void halvox_client_free(halvox_client* client);

/* The steps of a session's life. They are handed over and return at once, in order with the
 * messages; HALVOX_OK says that they were handed over. The service answers none of them with an
 * error when it knows no such session. */
HALVOX_API halvox_result halvox_client_create_session(halvox_client* client, int64_t id);
HALVOX_API halvox_result halvox_client_set_service_type(halvox_client* client, int64_t id,
                                                        uint16_t service_type);
/* Merged with what the session's configuration has already. */
HALVOX_API halvox_result halvox_client_set_configuration(halvox_client* client, int64_t id,
                                                         const halvox_dictionary* configuration);
HALVOX_API halvox_result halvox_client_start(halvox_client* client, int64_t id);
HALVOX_API halvox_result halvox_client_stop(halvox_client* client, int64_t id);
HALVOX_API halvox_result halvox_client_destroy_session(halvox_client* client, int64_t id);

/* Hand one message over: HALVOX_OK or HALVOX_DROPPED. None of them blocks, takes a lock or makes a
 * request, so an audio thread may call them; with a dictionary made beforehand, the first and the
 * last allocate nothing either. */
HALVOX_API halvox_result halvox_client_send(halvox_client* client, int64_t id,
                                            const halvox_dictionary* message, uint32_t category,
                                            uint16_t type);
/* To several sessions; with a count of 0 the service takes the message and gives it to none. */
HALVOX_API halvox_result halvox_client_send_to(halvox_client* client, const int64_t* ids,
                                               size_t count, const halvox_dictionary* message,
                                               uint32_t category, uint16_t type);
/* To all active sessions of all programs. */
HALVOX_API halvox_result halvox_client_send_to_all(halvox_client* client,
                                                   const halvox_dictionary* message,
                                                   uint32_t category, uint16_t type);

/* Waits until everything handed over before has been answered; HALVOX_TIMED_OUT when it has not
 * been in that time, and at once when called from the connection handler. */
HALVOX_API halvox_result halvox_client_flush(halvox_client* client, uint32_t timeout_ms);
HALVOX_API bool halvox_client_is_connected(const halvox_client* client);
HALVOX_API halvox_result halvox_client_counters(const halvox_client* client,
                                                halvox_counters* counters);
/* Calls the handler whenever the connection is made or lost, and soon if it is made already.
 * NULL ends that; a call that is under way may still come to its end afterwards. */
HALVOX_API halvox_result halvox_client_set_connection_handler(halvox_client* client,
                                                              halvox_connection_handler handler,
                                                              void* user_data);

#ifdef __cplusplus
}
#endif

#endif
