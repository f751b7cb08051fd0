/* Uses every function of the C interface, as C. The first argument is the socket of a service; the
 * program that started this one checks what arrived there. */
#include <stdio.h>
#include <string.h>

#include "client/halvox.h"

static int failures = 0;

#define CHECK(condition)                                                      \
  do {                                                                        \
    if (!(condition)) {                                                       \
      fprintf(stderr, "%s:%d: failed: %s\n", __FILE__, __LINE__, #condition); \
      ++failures;                                                             \
    }                                                                         \
  } while (0)

static void check_names(void) {
  char name[64];
  uint32_t category = 0;
  uint16_t number = 0;
  CHECK(halvox_category_name(HALVOX_DOMAIN_SESSION | HALVOX_CATEGORY_PLAYBACK, name, sizeof name) ==
        16);
  CHECK(strcmp(name, "Session_Playback") == 0);
  CHECK(halvox_category_name(HALVOX_CATEGORY_PLAYBACK, name, 5) == 8);
  CHECK(strcmp(name, "Play") == 0);
  CHECK(halvox_category_name(HALVOX_CATEGORY_PLAYBACK, NULL, 0) == 8);
  CHECK(strcmp(halvox_event_type_name(HALVOX_EVENT_STATE), "State") == 0);
  CHECK(strcmp(halvox_service_type_name(HALVOX_SERVICE_TELEPHONY), "telephony") == 0);
  CHECK(halvox_find_category("toolbox_error", &category));
  CHECK(category == (HALVOX_DOMAIN_TOOLBOX | HALVOX_CATEGORY_ERROR));
  CHECK(halvox_find_event_type("Start", &number) && number == HALVOX_EVENT_START);
  CHECK(halvox_find_service_type("test", &number) && number == HALVOX_SERVICE_TEST);
  CHECK(!halvox_find_service_type("nonsense", &number) && number == HALVOX_SERVICE_TEST);
  CHECK(!halvox_find_category(NULL, &category));
}

static halvox_array* make_array(void) {
  halvox_array* array = halvox_array_new();
  halvox_array* inner = halvox_array_new();
  halvox_dictionary* dictionary = halvox_dictionary_new();
  CHECK(halvox_array_append_int64(array, INT64_MIN) == HALVOX_OK);
  CHECK(halvox_array_append_uint64(array, UINT64_MAX) == HALVOX_OK);
  CHECK(halvox_array_append_double(array, 0.5) == HALVOX_OK);
  CHECK(halvox_array_append_bool(array, true) == HALVOX_OK);
  CHECK(halvox_array_append_string(array, "text") == HALVOX_OK);
  CHECK(halvox_array_append_data(array, "\x00\xff", 2) == HALVOX_OK);
  CHECK(halvox_array_append_date(array, 1.5) == HALVOX_OK);
  CHECK(halvox_array_append_dictionary(array, dictionary) == HALVOX_OK);
  CHECK(halvox_array_append_array(array, inner) == HALVOX_OK);
  CHECK(halvox_array_append_string(array, "\xff") == HALVOX_BAD_ARGUMENT);
  CHECK(halvox_array_count(array) == 9);
  halvox_dictionary_free(dictionary);
  halvox_array_free(inner);
  return array;
}

static halvox_dictionary* make_dictionary(void) {
  halvox_dictionary* dictionary = halvox_dictionary_new();
  halvox_dictionary* inner = halvox_dictionary_new();
  halvox_array* array = make_array();
  CHECK(halvox_dictionary_set_int64(dictionary, "int64", -5) == HALVOX_OK);
  CHECK(halvox_dictionary_set_uint64(dictionary, "uint64", 5) == HALVOX_OK);
  CHECK(halvox_dictionary_set_double(dictionary, "double", 2.25) == HALVOX_OK);
  CHECK(halvox_dictionary_set_bool(dictionary, "bool", false) == HALVOX_OK);
  CHECK(halvox_dictionary_set_string(dictionary, "string", "\xC3\xA4") == HALVOX_OK);
  CHECK(halvox_dictionary_set_data(dictionary, "data", "xyz", 3) == HALVOX_OK);
  CHECK(halvox_dictionary_set_date(dictionary, "date", 1e9) == HALVOX_OK);
  CHECK(halvox_dictionary_set_int64(inner, "inside", 1) == HALVOX_OK);
  CHECK(halvox_dictionary_set_dictionary(dictionary, "dictionary", inner) == HALVOX_OK);
  CHECK(halvox_dictionary_set_array(dictionary, "array", array) == HALVOX_OK);
  CHECK(halvox_dictionary_set_int64(inner, "inside", 2) == HALVOX_OK); /* not in the copy */
  CHECK(halvox_dictionary_set_bool(dictionary, "gone", true) == HALVOX_OK);
  CHECK(halvox_dictionary_remove(dictionary, "gone"));
  CHECK(!halvox_dictionary_remove(dictionary, "gone"));
  CHECK(halvox_dictionary_set_int64(dictionary, "\xff", 1) == HALVOX_BAD_ARGUMENT);
  CHECK(halvox_dictionary_set_int64(dictionary, NULL, 1) == HALVOX_BAD_ARGUMENT);
  CHECK(halvox_dictionary_set_int64(NULL, "key", 1) == HALVOX_BAD_ARGUMENT);
  CHECK(halvox_dictionary_set_string(dictionary, "null", NULL) == HALVOX_BAD_ARGUMENT);
  CHECK(halvox_dictionary_count(dictionary) == 9);
  halvox_array_free(array);
  halvox_dictionary_free(inner);
  return dictionary;
}

static void on_connection(bool connected, void* user_data) {
  if (connected) *(bool*)user_data = true;
}

static void check_counters(const halvox_client* client) {
  halvox_counters counters = {.size = sizeof counters};
  CHECK(halvox_client_counters(client, &counters) == HALVOX_OK);
  CHECK(counters.accepted == 3);
  CHECK(counters.acknowledged == 3);
  CHECK(counters.dropped == 0 && counters.refused == 0 && counters.lost == 0);
  CHECK(counters.pending == 0 && counters.reconnects == 0);

  /* For a caller that was built before `dropped` existed, nothing may be written after its struct.
   * */
  halvox_counters shorter = {.size = offsetof(halvox_counters, dropped), .dropped = 77};
  CHECK(halvox_client_counters(client, &shorter) == HALVOX_OK);
  CHECK(shorter.accepted == 3 && shorter.dropped == 77);
}

static void check_client(const char* socket_path) {
  const halvox_options options = {.size = sizeof options, .socket_path = socket_path};
  const int64_t ids[] = {7, 8};
  bool connected = false;
  halvox_client* client = halvox_client_new(&options);
  halvox_dictionary* message = make_dictionary();
  CHECK(client != NULL);
  CHECK(halvox_client_set_connection_handler(client, on_connection, &connected) == HALVOX_OK);
  CHECK(halvox_client_create_session(client, 7) == HALVOX_OK);
  CHECK(halvox_client_set_service_type(client, 7, HALVOX_SERVICE_TEST) == HALVOX_OK);
  CHECK(halvox_client_set_configuration(client, 7, message) == HALVOX_OK);
  CHECK(halvox_client_start(client, 7) == HALVOX_OK);
  CHECK(halvox_client_send(client, 7, message, HALVOX_CATEGORY_PLAYBACK, HALVOX_EVENT_START) ==
        HALVOX_OK);
  CHECK(halvox_client_send_to(client, ids, 2, message, HALVOX_CATEGORY_PLAYBACK,
                              HALVOX_EVENT_STOP) == HALVOX_OK);
  CHECK(halvox_client_send_to_all(client, message, HALVOX_CATEGORY_VOLUME, HALVOX_EVENT_STATE) ==
        HALVOX_OK);
  CHECK(halvox_client_stop(client, 7) == HALVOX_OK);
  CHECK(halvox_client_destroy_session(client, 7) == HALVOX_OK);
  CHECK(halvox_client_flush(client, 20000) == HALVOX_OK);
  CHECK(connected);
  CHECK(halvox_client_is_connected(client));
  CHECK(halvox_client_set_connection_handler(client, NULL, NULL) == HALVOX_OK);
  check_counters(client);
  CHECK(halvox_client_send(client, 7, NULL, 1, 1) == HALVOX_BAD_ARGUMENT);
  halvox_dictionary_free(message);
  halvox_client_free(client);
}

static void check_bounds(void) {
  const halvox_options options = {
      .size = sizeof options, .socket_path = "/nonexistent/socket", .max_pending_messages = 2};
  halvox_client* client = halvox_client_new(&options);
  halvox_dictionary* message = halvox_dictionary_new();
  CHECK(halvox_client_send(client, 7, message, 1, 1) == HALVOX_OK);
  CHECK(halvox_client_send(client, 7, message, 1, 1) == HALVOX_OK);
  CHECK(halvox_client_send(client, 7, message, 1, 1) == HALVOX_DROPPED);
  CHECK(halvox_client_flush(client, 1) == HALVOX_TIMED_OUT);
  CHECK(!halvox_client_is_connected(client));
  halvox_dictionary_free(message);
  halvox_client_free(client);
}

int main(int argc, char** argv) {
  char path[256];
  if (argc != 2) {
    fprintf(stderr, "usage: halvox_c_test SOCKET\n");
    return 2;
  }
  CHECK(halvox_default_socket_path(path, sizeof path) == strlen(path));
  CHECK(strcmp(halvox_result_text(HALVOX_OK), "done") == 0);
  check_names();
  check_client(argv[1]);
  check_bounds();
  halvox_client_free(NULL);
  halvox_dictionary_free(NULL);
  halvox_array_free(NULL);
  return failures == 0 ? 0 : 1;
}
