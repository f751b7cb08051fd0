#include "client/halvox.h"

#include <algorithm>
#include <chrono>
#include <cstring>
#include <exception>
#include <optional>
#include <span>
#include <string>
#include <utility>

#include "client/EncodedArray.h"
#include "client/EncodedDictionary.h"
#include "client/HalvoxClient.h"
#include "client/Vocabulary.h"

// The handles are plain structs around the C++ objects. No exception may leave this file. The C++
// functions that it calls throw only if there is no memory or no thread left.

namespace client = halvox::client;
using halvox::platform::Date;

struct halvox_client {
  explicit halvox_client(client::Options options) : client(std::move(options)) {}
  client::HalvoxClient client;
};
struct halvox_dictionary {
  client::EncodedDictionary dictionary;
};
struct halvox_array {
  client::EncodedArray array;
};

namespace {

template <typename Work>
halvox_result guarded(Work&& work) noexcept {
  try {
    return std::forward<Work>(work)();
  } catch (const std::exception&) {
    return HALVOX_NO_MEMORY;
  }
}

template <typename Work>
halvox_result done(Work&& work) noexcept {
  return guarded([&] {
    work();
    return HALVOX_OK;
  });
}

// Returns the bytes of a data value; std::nullopt if `bytes` is null although `size` is not 0.
std::optional<std::span<const std::byte>> bytesAt(const void* bytes, size_t size) {
  if (bytes == nullptr && size > 0) return std::nullopt;
  return std::span(static_cast<const std::byte*>(bytes), size);
}

template <typename Value>
halvox_result set(halvox_dictionary* dictionary, const char* key, const Value& value) {
  if (dictionary == nullptr || key == nullptr) return HALVOX_BAD_ARGUMENT;
  return guarded(
      [&] { return dictionary->dictionary.set(key, value) ? HALVOX_OK : HALVOX_BAD_ARGUMENT; });
}

template <typename Value>
halvox_result append(halvox_array* array, const Value& value) {
  if (array == nullptr) return HALVOX_BAD_ARGUMENT;
  return done([&] { array->array.append(value); });
}

size_t fill(std::string_view text, char* buffer, size_t size) {
  if (size > 0 && buffer != nullptr) {
    const size_t length = std::min(text.size(), size - 1);
    std::memcpy(buffer, text.data(), length);
    buffer[length] = '\0';
  }
  return text.size();
}

// Copies a struct of the caller. It is shorter if the caller was built with an earlier version.
template <typename Struct>
Struct takeStruct(const Struct& given) {
  Struct full{};
  std::memcpy(&full, &given, std::min(given.size, sizeof full));
  return full;
}

client::Options makeOptions(const halvox_options* given) {
  client::Options options;
  if (given == nullptr) return options;
  const auto use = [](auto& option, auto value) {
    if (value != 0) option = std::remove_reference_t<decltype(option)>(value);
  };
  const halvox_options full = takeStruct(*given);
  if (full.socket_path != nullptr) options.socketPath = full.socket_path;
  use(options.maxPendingMessages, full.max_pending_messages);
  use(options.maxPendingBytes, full.max_pending_bytes);
  use(options.requestTimeout, full.request_timeout_ms);
  use(options.reconnectMin, full.reconnect_min_ms);
  use(options.reconnectMax, full.reconnect_max_ms);
  options.isRealTime = full.real_time != 0;
  return options;
}

template <typename Number, typename Found>
bool store(const std::optional<Found>& found, Number* number) {
  if (!found || number == nullptr) return false;
  *number = *found;
  return true;
}

halvox_result sent(bool taken) { return taken ? HALVOX_OK : HALVOX_DROPPED; }

}  // namespace

const char* halvox_result_text(halvox_result result) {
  switch (result) {
    case HALVOX_OK:
      return "done";
    case HALVOX_DROPPED:
      return "dropped: too many messages are waiting";
    case HALVOX_TIMED_OUT:
      return "timed out";
    case HALVOX_BAD_ARGUMENT:
      return "an argument is missing or is not UTF-8 text";
    case HALVOX_NO_MEMORY:
      return "out of memory or threads";
  }
  return "unknown";
}

// ---- The numbers of the protocol

size_t halvox_category_name(uint32_t category, char* buffer, size_t size) {
  return fill(client::categoryName(category), buffer, size);
}

// The names are string literals. They therefore end with a NUL.
const char* halvox_event_type_name(uint16_t type) { return client::eventTypeName(type).data(); }

const char* halvox_service_type_name(uint16_t type) { return client::serviceTypeName(type).data(); }

bool halvox_find_category(const char* name, uint32_t* category) {
  return name != nullptr && store(client::findCategory(name), category);
}

bool halvox_find_event_type(const char* name, uint16_t* type) {
  return name != nullptr && store(client::findEventType(name), type);
}

bool halvox_find_service_type(const char* name, uint16_t* type) {
  return name != nullptr && store(client::findServiceType(name), type);
}

// ---- Values

halvox_dictionary* halvox_dictionary_new(void) { return new (std::nothrow) halvox_dictionary; }

void halvox_dictionary_free(halvox_dictionary* dictionary) { delete dictionary; }

size_t halvox_dictionary_count(const halvox_dictionary* dictionary) {
  return dictionary != nullptr ? dictionary->dictionary.size() : 0;
}

halvox_result halvox_dictionary_set_int64(halvox_dictionary* dictionary, const char* key,
                                          int64_t value) {
  return set(dictionary, key, value);
}

halvox_result halvox_dictionary_set_uint64(halvox_dictionary* dictionary, const char* key,
                                           uint64_t value) {
  return set(dictionary, key, value);
}

halvox_result halvox_dictionary_set_double(halvox_dictionary* dictionary, const char* key,
                                           double value) {
  return set(dictionary, key, value);
}

halvox_result halvox_dictionary_set_bool(halvox_dictionary* dictionary, const char* key,
                                         bool value) {
  return set(dictionary, key, value);
}

halvox_result halvox_dictionary_set_string(halvox_dictionary* dictionary, const char* key,
                                           const char* value) {
  if (value == nullptr) return HALVOX_BAD_ARGUMENT;
  return set(dictionary, key, value);
}

halvox_result halvox_dictionary_set_data(halvox_dictionary* dictionary, const char* key,
                                         const void* bytes, size_t size) {
  const auto data = bytesAt(bytes, size);
  return data ? set(dictionary, key, *data) : HALVOX_BAD_ARGUMENT;
}

halvox_result halvox_dictionary_set_date(halvox_dictionary* dictionary, const char* key,
                                         double seconds_since_1970) {
  return set(dictionary, key, Date{seconds_since_1970});
}

halvox_result halvox_dictionary_set_dictionary(halvox_dictionary* dictionary, const char* key,
                                               const halvox_dictionary* value) {
  if (value == nullptr) return HALVOX_BAD_ARGUMENT;
  return set(dictionary, key, value->dictionary);
}

halvox_result halvox_dictionary_set_array(halvox_dictionary* dictionary, const char* key,
                                          const halvox_array* value) {
  if (value == nullptr) return HALVOX_BAD_ARGUMENT;
  return set(dictionary, key, value->array);
}

bool halvox_dictionary_remove(halvox_dictionary* dictionary, const char* key) {
  return dictionary != nullptr && key != nullptr && dictionary->dictionary.remove(key);
}

halvox_array* halvox_array_new(void) { return new (std::nothrow) halvox_array; }

void halvox_array_free(halvox_array* array) { delete array; }

size_t halvox_array_count(const halvox_array* array) {
  return array != nullptr ? array->array.size() : 0;
}

halvox_result halvox_array_append_int64(halvox_array* array, int64_t value) {
  return append(array, value);
}

halvox_result halvox_array_append_uint64(halvox_array* array, uint64_t value) {
  return append(array, value);
}

halvox_result halvox_array_append_double(halvox_array* array, double value) {
  return append(array, value);
}

halvox_result halvox_array_append_bool(halvox_array* array, bool value) {
  return append(array, value);
}

halvox_result halvox_array_append_string(halvox_array* array, const char* value) {
  if (array == nullptr || value == nullptr) return HALVOX_BAD_ARGUMENT;
  return guarded([&] { return array->array.append(value) ? HALVOX_OK : HALVOX_BAD_ARGUMENT; });
}

halvox_result halvox_array_append_data(halvox_array* array, const void* bytes, size_t size) {
  const auto data = bytesAt(bytes, size);
  return data ? append(array, *data) : HALVOX_BAD_ARGUMENT;
}

halvox_result halvox_array_append_date(halvox_array* array, double seconds_since_1970) {
  return append(array, Date{seconds_since_1970});
}

halvox_result halvox_array_append_dictionary(halvox_array* array, const halvox_dictionary* value) {
  if (value == nullptr) return HALVOX_BAD_ARGUMENT;
  return append(array, value->dictionary);
}

halvox_result halvox_array_append_array(halvox_array* array, const halvox_array* value) {
  if (value == nullptr) return HALVOX_BAD_ARGUMENT;
  return append(array, value->array);
}

// ---- The client

size_t halvox_default_socket_path(char* buffer, size_t size) {
  return fill(client::defaultSocketPath(), buffer, size);
}

halvox_client* halvox_client_new(const halvox_options* options) {
  halvox_client* made = nullptr;
  done([&] { made = new halvox_client(makeOptions(options)); });
  return made;
}

void halvox_client_free(halvox_client* client) { delete client; }

halvox_result halvox_client_create_session(halvox_client* client, int64_t id) {
  if (client == nullptr) return HALVOX_BAD_ARGUMENT;
  return done([&] { client->client.createSession(id); });
}

halvox_result halvox_client_set_service_type(halvox_client* client, int64_t id,
                                             uint16_t service_type) {
  if (client == nullptr) return HALVOX_BAD_ARGUMENT;
  return done([&] { client->client.setServiceType(id, service_type); });
}

halvox_result halvox_client_set_configuration(halvox_client* client, int64_t id,
                                              const halvox_dictionary* configuration) {
  if (client == nullptr || configuration == nullptr) return HALVOX_BAD_ARGUMENT;
  return guarded([&] {
    auto dictionary = configuration->dictionary.decode();
    if (!dictionary) return HALVOX_BAD_ARGUMENT;
    client->client.setConfiguration(id, std::move(*dictionary));
    return HALVOX_OK;
  });
}

halvox_result halvox_client_start(halvox_client* client, int64_t id) {
  if (client == nullptr) return HALVOX_BAD_ARGUMENT;
  return done([&] { client->client.start(id); });
}

halvox_result halvox_client_stop(halvox_client* client, int64_t id) {
  if (client == nullptr) return HALVOX_BAD_ARGUMENT;
  return done([&] { client->client.stop(id); });
}

halvox_result halvox_client_destroy_session(halvox_client* client, int64_t id) {
  if (client == nullptr) return HALVOX_BAD_ARGUMENT;
  return done([&] { client->client.destroySession(id); });
}

[[gnu::hot]] halvox_result halvox_client_send(halvox_client* client, int64_t id,
                                              const halvox_dictionary* message, uint32_t category,
                                              uint16_t type) {
  if (client == nullptr || message == nullptr) return HALVOX_BAD_ARGUMENT;
  return guarded(
      [&] { return sent(client->client.send(id, message->dictionary, category, type)); });
}

[[gnu::hot]] halvox_result halvox_client_send_to(halvox_client* client, const int64_t* ids,
                                                 size_t count, const halvox_dictionary* message,
                                                 uint32_t category, uint16_t type) {
  const bool idsAreGood = ids != nullptr || count == 0;
  if (client == nullptr || message == nullptr || !idsAreGood) return HALVOX_BAD_ARGUMENT;
  return guarded([&] {
    return sent(client->client.sendTo(std::span(ids, count), message->dictionary, category, type));
  });
}

[[gnu::hot]] halvox_result halvox_client_send_to_all(halvox_client* client,
                                                     const halvox_dictionary* message,
                                                     uint32_t category, uint16_t type) {
  if (client == nullptr || message == nullptr) return HALVOX_BAD_ARGUMENT;
  return guarded(
      [&] { return sent(client->client.sendToAll(message->dictionary, category, type)); });
}

halvox_result halvox_client_flush(halvox_client* client, uint32_t timeout_ms) {
  if (client == nullptr) return HALVOX_BAD_ARGUMENT;
  return guarded([&] {
    const bool answered = client->client.flush(std::chrono::milliseconds(timeout_ms));
    return answered ? HALVOX_OK : HALVOX_TIMED_OUT;
  });
}

bool halvox_client_is_connected(const halvox_client* client) {
  return client != nullptr && client->client.isConnected();
}

halvox_result halvox_client_counters(const halvox_client* client, halvox_counters* counters) {
  if (client == nullptr || counters == nullptr) return HALVOX_BAD_ARGUMENT;
  const client::Counters now = client->client.counters();
  const halvox_counters full{
      .size = counters->size,
      .accepted = now.accepted,
      .dropped = now.dropped,
      .acknowledged = now.acknowledged,
      .refused = now.refused,
      .lost = now.lost,
      .pending = now.pending,
      .reconnects = now.reconnects,
  };
  std::memcpy(counters, &full, std::min(counters->size, sizeof full));
  return HALVOX_OK;
}

halvox_result halvox_client_set_connection_handler(halvox_client* client,
                                                   halvox_connection_handler handler,
                                                   void* user_data) {
  if (client == nullptr) return HALVOX_BAD_ARGUMENT;
  return done([&] {
    if (handler == nullptr) {
      client->client.setConnectionHandler(nullptr);
    } else {
      client->client.setConnectionHandler(
          [handler, user_data](bool connected) { handler(connected, user_data); });
    }
  });
}
