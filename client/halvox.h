#ifndef HALVOX_H
#define HALVOX_H

/** @file
 * The client of the Halvox reporting service, for C.
 *
 * @code{.c}
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
 * @endcode
 *
 * A client has one thread of its own, which exchanges all messages with the service. If the service
 * ends, the client waits for a new one, connects to it and makes its sessions again. Messages wait
 * meanwhile, up to the bounds in halvox_options. After fork(), a client works only in the process
 * that made it.
 *
 * Threads: any thread may call any function on a client. halvox_client_free() must be the last
 * call. Several threads may read a dictionary or an array at the same time; sending it counts as
 * reading. While one thread changes it, no other thread may use it.
 *
 * Ownership: release the result of a ..._new function with the ..._free function of the same kind;
 * these accept NULL and do nothing. Functions copy all other arguments before they return.
 *
 * Cost: dictionaries and arrays keep their content in the encoding of a message. Sending a
 * dictionary copies these bytes, and storing one container in another copies those of the inner
 * one. Make a message once, and change its values: a new number, or a text of the same length, for
 * an existing key overwrites the old one and allocates nothing. Up to 16 keys and 512 bytes need no
 * memory but that of halvox_dictionary_new().
 *
 * Errors: functions that can fail return a halvox_result, or NULL or false as their comment says.
 * Passing NULL where a client, dictionary or array is needed is HALVOX_BAD_ARGUMENT, never a crash.
 * A failed call changes nothing.
 *
 * Texts are UTF-8 and end with a NUL. Times are in milliseconds if the name ends in _ms. */

#include <stdbool.h>
#include <stddef.h>
#include <stdint.h>

#ifdef __cplusplus
extern "C" {
#endif

/** Marks what the shared library exports. */
#if defined(__GNUC__)
#define HALVOX_API __attribute__((visibility("default")))
#else
#define HALVOX_API
#endif

/** A connection to the service, with its own thread and sessions. */
typedef struct halvox_client halvox_client;
/** Values with text keys: a message or a configuration. A key occurs only once. */
typedef struct halvox_dictionary halvox_dictionary;
/** A list of values, which may be of different types. */
typedef struct halvox_array halvox_array;

/** The outcome of a call. */
typedef enum halvox_result {
  HALVOX_OK = 0,
  HALVOX_DROPPED = 1,   /**< message not accepted: a bound of halvox_options is reached; counted */
  HALVOX_TIMED_OUT = 2, /**< not finished within the given time */
  HALVOX_BAD_ARGUMENT = 3, /**< NULL where an object is needed, or a text that is not UTF-8 */
  HALVOX_NO_MEMORY = 4     /**< no memory, or no thread for a new client */
} halvox_result;

/** Returns a short English description of a result, never NULL. The text is static. */
HALVOX_API const char* halvox_result_text(halvox_result result);

/* ---- The numbers of the protocol ------------------------------------------------------------ */

/** What a message is about. A category is one of these numbers, optionally combined with one domain
 * by the operator |. */
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

/** @{ */
/** The part of the audio system that a message comes from. These are macros because the constants
 * of a C enumeration are signed, and the last one would not fit. */
#define HALVOX_DOMAIN_MIDI UINT32_C(0x04000000)
#define HALVOX_DOMAIN_SESSION UINT32_C(0x08000000)
#define HALVOX_DOMAIN_DSP UINT32_C(0x10000000)
#define HALVOX_DOMAIN_HAL UINT32_C(0x20000000)
#define HALVOX_DOMAIN_ROUTING UINT32_C(0x40000000)
#define HALVOX_DOMAIN_TOOLBOX UINT32_C(0x80000000)
/** @} */

/** What happened: the type of a message. */
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

/** What kind of audio a session is for: its service type. */
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

/** Writes the name of a category, such as "Session_Playback", into a buffer of `size` bytes, as
 * snprintf() does: always ends it with a NUL, cuts a name that is too long, and returns the length
 * of the whole name without the NUL. With a size of 0 it only returns the length, and `buffer` may
 * be NULL. A category without a name is "Undefined", after its domain if it has one. */
HALVOX_API size_t halvox_category_name(uint32_t category, char* buffer, size_t size);
/** @{ */
/** Return the name of an event type or a service type, such as "Start" or "telephony". The texts
 * are static. As in the service, an event type without a name is "Generic", and a service type
 * without a name is "telephony". */
HALVOX_API const char* halvox_event_type_name(uint16_t type);
HALVOX_API const char* halvox_service_type_name(uint16_t type);
/** @} */

/** @{ */
/** Look up the number of a name, ignoring case, and store it. Return false and store nothing if the
 * name is unknown or an argument is NULL. */
HALVOX_API bool halvox_find_category(const char* name, uint32_t* category);
HALVOX_API bool halvox_find_event_type(const char* name, uint16_t* type);
HALVOX_API bool halvox_find_service_type(const char* name, uint16_t* type);
/** @} */

/* ---- Values --------------------------------------------------------------------------------- */

/** Makes an empty dictionary. The caller owns it and releases it with halvox_dictionary_free().
 * Returns NULL if there is no memory. */
HALVOX_API halvox_dictionary* halvox_dictionary_new(void);
/** Releases a dictionary. Messages and containers that hold its content are not affected. */
HALVOX_API void halvox_dictionary_free(halvox_dictionary* dictionary);
/** Returns the number of keys; 0 for NULL. */
HALVOX_API size_t halvox_dictionary_count(const halvox_dictionary* dictionary);

/** @{ */
/** Set the value of a key, and replace its old value if there is one. The key and the value are
 * copied. Return HALVOX_BAD_ARGUMENT if `dictionary` or `key` is NULL, or if the key or a string
 * value is not UTF-8; HALVOX_NO_MEMORY if there is no memory. Data of 0 bytes may be NULL. A date
 * is in seconds since 1970-01-01 00:00 UTC. */
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
/** @} */
/** @{ */
/** The inner container is stored as it is now: later changes to it do not change the outer one. */
HALVOX_API halvox_result halvox_dictionary_set_dictionary(halvox_dictionary* dictionary,
                                                          const char* key,
                                                          const halvox_dictionary* value);
HALVOX_API halvox_result halvox_dictionary_set_array(halvox_dictionary* dictionary, const char* key,
                                                     const halvox_array* value);
/** @} */
/** Removes a key. Returns false if there was no such key. */
HALVOX_API bool halvox_dictionary_remove(halvox_dictionary* dictionary, const char* key);

/** Makes an empty array. The caller owns it and releases it with halvox_array_free(). Returns NULL
 * if there is no memory. */
HALVOX_API halvox_array* halvox_array_new(void);
/** Releases an array. Containers that hold its content are not affected. */
HALVOX_API void halvox_array_free(halvox_array* array);
/** Returns the number of values; 0 for NULL. */
HALVOX_API size_t halvox_array_count(const halvox_array* array);
/** @{ */
/** Append one value. Units, copies and errors are those of the halvox_dictionary_set_...()
 * functions. */
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
/** @} */

/* ---- The client ----------------------------------------------------------------------------- */

/** How a client works. Set `size` to sizeof(halvox_options) and all other fields to 0 for their
 * defaults. `size` tells the library which fields this program knows. Fields that a later version
 * adds then have their defaults. */
typedef struct halvox_options {
  size_t size;                   /**< sizeof(halvox_options) */
  const char* socket_path;       /**< NULL: the usual places, see halvox_default_socket_path() */
  uint64_t max_pending_messages; /**< messages that may wait for the client's thread; 0: 8192 */
  uint64_t max_pending_bytes;    /**< memory of these messages, a multiple of 512 each; 0: 4 MiB */
  uint32_t request_timeout_ms;   /**< how long making a connection may take; 0: 5000 */
  uint32_t reconnect_min_ms;     /**< first pause between attempts to connect; 0: 50 */
  uint32_t reconnect_max_ms;     /**< longest pause, after several attempts; 0: 2000 */
  uint64_t real_time;            /**< not 0: for audio threads, see halvox_client_send() */
} halvox_options;

/** The number of messages for each outcome: accepted = acknowledged + refused + lost + pending. */
typedef struct halvox_counters {
  size_t size;           /**< set it to sizeof(halvox_counters) before the call */
  uint64_t accepted;     /**< a send function returned HALVOX_OK */
  uint64_t dropped;      /**< a send function returned HALVOX_DROPPED */
  uint64_t acknowledged; /**< answered by the service without an error, or taken by it at its end */
  uint64_t refused;      /**< answered with an error, or not representable on the wire */
  uint64_t lost;         /**< sent but not answered when the service crashed; it may have received
                            them. Also messages that were discarded because 8,192 session operations
                            were waiting without a service */
  uint64_t pending;      /**< waiting or in flight */
  uint64_t reconnects;   /**< connections made after the first one */
} halvox_counters;

/** Called when the connection is made (true) or lost (false). The handler runs on the client's
 * thread, which has a stack of 512 KiB and sends nothing until the handler returns. The handler
 * must not block or call halvox_client_free(). */
typedef void (*halvox_connection_handler)(bool connected, void* user_data);

/** Writes the path of the socket where a client with default options looks for the service now:
 *
 *   1. $HALVOX_SOCKET, if it is set;
 *   2. the user's service, $XDG_RUNTIME_DIR/halvox/reporting.sock, if it exists;
 *   3. the system's service, /run/halvox/reporting.sock, if it exists;
 *   4. otherwise the first of these places that is defined.
 *
 * A client also tries the next place if no service listens on a socket, and searches again at each
 * attempt. After its connection has ended, it tries only the same place for 10 seconds: a service
 * that is being restarted must not lose its clients to another one. Fills the buffer and returns
 * the length as halvox_category_name() does. */
HALVOX_API size_t halvox_default_socket_path(char* buffer, size_t size);

/** Starts a client with its thread. Does not wait for the service, and succeeds without one. Takes
 * about 0.8 MiB of memory. In a program that has called mlockall(MCL_FUTURE), takes
 * max_pending_bytes and another 0.6 MiB, which count towards the program's limit of locked memory.
 * `options` may be NULL for all defaults. The caller owns the client and releases it with
 * halvox_client_free(). Returns NULL if there is not enough memory or the thread cannot be started.
 * */
HALVOX_API halvox_client* halvox_client_new(const halvox_options* options);
/** Delivers pending messages for at most one second if the service is there, then ends the client,
 * its thread and its sessions. Blocks meanwhile. No call on this client may run or follow. */
HALVOX_API void halvox_client_free(halvox_client* client);

/** @name The steps of a session's life
 * `id` is a reporter ID, a number that the program chooses; 0 means no session. The calls hand the
 * step to the client's thread and return at once. Steps and messages of one thread are carried out
 * in the order of the calls. HALVOX_OK means that the step was handed over. A step for a session
 * that the service does not know has no effect, and the service reports no error. These functions
 * may wait for a lock for a moment and may allocate.
 * @{ */
/** Makes a session. It replaces an older one of this client with the same ID. */
HALVOX_API halvox_result halvox_client_create_session(halvox_client* client, int64_t id);
/** Says what kind of audio the session is for: a HALVOX_SERVICE_... number. */
HALVOX_API halvox_result halvox_client_set_service_type(halvox_client* client, int64_t id,
                                                        uint16_t service_type);
/** Merges a dictionary into the session's configuration: a new value replaces the old one of the
 * same key. Returns HALVOX_BAD_ARGUMENT if the dictionary is nested too deep for a message or
 * longer than 64 MiB. */
HALVOX_API halvox_result halvox_client_set_configuration(halvox_client* client, int64_t id,
                                                         const halvox_dictionary* configuration);
/** Starts reporting for the session. The service answers a start only at the stop; the client does
 * not wait for that. */
HALVOX_API halvox_result halvox_client_start(halvox_client* client, int64_t id);
/** Stops the session, which may be started again. */
HALVOX_API halvox_result halvox_client_stop(halvox_client* client, int64_t id);
/** Removes the session, and stops it first if it runs. */
HALVOX_API halvox_result halvox_client_destroy_session(halvox_client* client, int64_t id);
/** @} */

/** Hand one message for one session to the client's thread. The session may belong to another
 * client. Returns HALVOX_OK, or HALVOX_DROPPED if a bound of halvox_options is reached or the
 * client is ending; halvox_client_counters() counts both. `category` is a HALVOX_CATEGORY_...
 * number, optionally with a domain, `type` is a HALVOX_EVENT_... number.
 *
 * An audio thread may call the send functions: they copy the message, keep no reference to it, and
 * never block, allocate, take a lock or wait for the service. If no message was sent for 50 ms,
 * they make one system call, to wake the client's thread. With the option `real_time` they make
 * none while a session runs: the thread then looks for messages by itself, at least a hundred times
 * a second. */
HALVOX_API halvox_result halvox_client_send(halvox_client* client, int64_t id,
                                            const halvox_dictionary* message, uint32_t category,
                                            uint16_t type);
/** The same for several sessions. With a count of 0 the service accepts the message and gives it to
 * no session; `ids` may then be NULL. */
HALVOX_API halvox_result halvox_client_send_to(halvox_client* client, const int64_t* ids,
                                               size_t count, const halvox_dictionary* message,
                                               uint32_t category, uint16_t type);
/** The same for all started sessions of all programs. */
HALVOX_API halvox_result halvox_client_send_to_all(halvox_client* client,
                                                   const halvox_dictionary* message,
                                                   uint32_t category, uint16_t type);

/** Blocks until everything that was handed over before this call has been answered or lost. Returns
 * HALVOX_TIMED_OUT after `timeout_ms`, and at once if it is called from the connection handler,
 * whose thread would have to do the work. */
HALVOX_API halvox_result halvox_client_flush(halvox_client* client, uint32_t timeout_ms);
/** Returns true while a connection to the service exists. Never blocks. */
HALVOX_API bool halvox_client_is_connected(const halvox_client* client);
/** Stores the current counters. Set `counters->size` before the call, because only fields within
 * that size are written. Never blocks. */
HALVOX_API halvox_result halvox_client_counters(const halvox_client* client,
                                                halvox_counters* counters);
/** Sets the function to call when the connection is made or lost. If there is a connection already,
 * the handler is called soon with true. Replaces an earlier handler; NULL removes it. A call that
 * is running when the handler is replaced may end after this function has returned. `user_data`
 * must exist until that call ends, at the latest until halvox_client_free() returns. */
HALVOX_API halvox_result halvox_client_set_connection_handler(halvox_client* client,
                                                              halvox_connection_handler handler,
                                                              void* user_data);

#ifdef __cplusplus
}
#endif

#endif
