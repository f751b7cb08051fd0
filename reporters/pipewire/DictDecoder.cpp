#include "reporters/pipewire/DictDecoder.h"

#include <spa/utils/dict.h>

namespace halvox::pipewire_reporter {

Properties makeProperties(const spa_dict* dict) {
  Properties properties;
  if (dict == nullptr) {
    return properties;
  }
  const spa_dict_item* item = nullptr;
  spa_dict_for_each(item, dict) {
    // The dictionary comes from another process. An entry may lack its key or its value.
    if (item->key != nullptr && item->value != nullptr) {
      properties.insert_or_assign(item->key, item->value);
    }
  }
  return properties;
}

}  // namespace halvox::pipewire_reporter
