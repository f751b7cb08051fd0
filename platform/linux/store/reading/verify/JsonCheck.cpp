#include "platform/linux/store/reading/verify/JsonCheck.h"

#include <rapidjson/memorystream.h>
#include <rapidjson/reader.h>

namespace halvox::platform::linux_ {

bool isJsonObject(std::string_view text) {
  if (!text.starts_with('{')) return false;
  rapidjson::MemoryStream stream(text.data(), text.size());
  rapidjson::BaseReaderHandler<> handler;
  rapidjson::Reader reader;
  // Iterative, because a deep text would exhaust the stack.
  return !reader.Parse<rapidjson::kParseIterativeFlag>(stream, handler).IsError();
}

}  // namespace halvox::platform::linux_
