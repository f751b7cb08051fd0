#include "platform/linux/tracing/PlistPropertyListService.h"

#include <algorithm>
#include <cerrno>
#include <cstdlib>
#include <filesystem>
#include <span>
#include <system_error>
#include <utility>
#include <vector>

#include <plist/plist.h>
#include <sys/stat.h>

#include "platform/linux/base/UniqueHandle.h"
#include "platform/linux/base/Utf8.h"
#include "platform/linux/base/WholeFile.h"
#include "platform/linux/files/FileError.h"
#include "platform/linux/tracing/PropertyListShape.h"

namespace halvox::platform::linux_ {
namespace {

using List = UniqueHandle<plist_t, plist_free>;
using Iterator = UniqueHandle<void*, std::free>;
using OwnedText = UniqueHandle<char*, std::free>;

constexpr PropertyListBounds kBounds;

Error parseError(std::string_view what) {
  return {.domain = "com.tarno.halvox.propertylist",
          .code = EINVAL,
          .description = "the property list " + std::string(what)};
}

Value convert(plist_t node, std::size_t levelsLeft, bool& isTooDeep);

Value integer(plist_t node) {
  std::uint64_t number = 0;
  plist_get_uint_val(node, &number);
  if (number <= INT64_MAX) return static_cast<std::int64_t>(number);
  // The library has no function for the sign, but its text output contains it.
  OwnedText text;
  std::uint32_t length = 0;
  plist_to_xml(node, text.out(), &length);
  const bool isNegative =
      std::string_view(text.get(), text ? length : 0).find("<integer>-") != std::string_view::npos;
  if (isNegative) return static_cast<std::int64_t>(number);
  return number;
}

Value date(plist_t node) {
  constexpr double kSecondsTo2001 = 978'307'200;  // property lists count dates from 2001
  constexpr double kMicrosecond = 1e-6;
  std::int32_t seconds = 0;
  std::int32_t microseconds = 0;
  plist_get_date_val(node, &seconds, &microseconds);
  return Date{kSecondsTo2001 + seconds + microseconds * kMicrosecond};
}

Value data(plist_t node) {
  std::uint64_t length = 0;
  const char* const bytes = plist_get_data_ptr(node, &length);
  return Data(std::as_bytes(std::span(bytes, bytes == nullptr ? 0 : length)));
}

Value text(plist_t node) {
  std::uint64_t length = 0;
  const char* const bytes = plist_get_string_ptr(node, &length);
  return replaceInvalidUtf8(std::string_view(bytes, bytes == nullptr ? 0 : length));
}

Value array(plist_t node, std::size_t levelsLeft, bool& isTooDeep) {
  std::vector<Value> values;
  values.reserve(plist_array_get_size(node));
  Iterator iterator;
  plist_array_new_iter(node, iterator.out());
  for (;;) {
    plist_t item = nullptr;
    plist_array_next_item(node, iterator.get(), &item);
    if (item == nullptr) return Array(values);
    values.push_back(convert(item, levelsLeft, isTooDeep));
  }
}

Value dictionary(plist_t node, std::size_t levelsLeft, bool& isTooDeep) {
  Dictionary result;
  result.reserve(plist_dict_get_size(node));
  Iterator iterator;
  plist_dict_new_iter(node, iterator.out());
  for (;;) {
    OwnedText key;
    plist_t item = nullptr;
    plist_dict_next_item(node, iterator.get(), key.out(), &item);
    if (item == nullptr) return result;
    result.set(replaceInvalidUtf8(key ? key.get() : ""), convert(item, levelsLeft, isTooDeep));
  }
}

Value convert(plist_t node, std::size_t levelsLeft, bool& isTooDeep) {
  const plist_type type = plist_get_node_type(node);
  isTooDeep = isTooDeep || (levelsLeft == 0 && (type == PLIST_ARRAY || type == PLIST_DICT));
  if (isTooDeep) return {};
  switch (type) {
    case PLIST_BOOLEAN: {
      std::uint8_t isTrue = 0;
      plist_get_bool_val(node, &isTrue);
      return isTrue != 0;
    }
    case PLIST_UINT:
      return integer(node);
    case PLIST_UID: {
      std::uint64_t number = 0;
      plist_get_uid_val(node, &number);
      return number;
    }
    case PLIST_REAL: {
      double number = 0;
      plist_get_real_val(node, &number);
      return number;
    }
    case PLIST_STRING:
    case PLIST_KEY:
      return text(node);
    case PLIST_DATE:
      return date(node);
    case PLIST_DATA:
      return data(node);
    case PLIST_ARRAY:
      return array(node, levelsLeft - 1, isTooDeep);
    case PLIST_DICT:
      return dictionary(node, levelsLeft - 1, isTooDeep);
    case PLIST_NONE:
      return {};
  }
  return {};
}

}  // namespace

std::string PlistPropertyListService::currentDirectory() const {
  std::error_code error;
  return std::filesystem::current_path(error).string();
}

std::optional<Data> PlistPropertyListService::readFile(std::string_view path,
                                                       std::optional<Error>& error) const {
  const std::string name(path);
  const auto fail = [&](int systemError) {
    error = fileError("read", name, systemError);
    return std::nullopt;
  };
  // The system would end the name at the NUL and open another file.
  if (name.find('\0') != std::string::npos) return fail(EINVAL);
  const FileContent content = readWholeFile({.path = name.c_str(), .most = kMostFileBytes});
  switch (content.outcome) {
    case FileContent::Outcome::kRead:
      if (content.bytes.size() > content.size) return fail(EAGAIN);  // the file is being written
      return Data(std::as_bytes(std::span(content.bytes)));
    case FileContent::Outcome::kNotRegular:
      return fail(S_ISDIR(content.mode) ? EISDIR : EINVAL);
    case FileContent::Outcome::kTooLarge:
      // The file was small enough when it was opened and has grown since. A program is still
      // writing it.
      return fail(content.size > kMostFileBytes ? EFBIG : EAGAIN);
    case FileContent::Outcome::kMissing:
    case FileContent::Outcome::kFailed:
      break;
  }
  return fail(content.error);
}

std::optional<Value> PlistPropertyListService::parse(const std::optional<Data>& bytes,
                                                     std::optional<Error>& error) const {
  const auto fail = [&](std::string_view what) {
    error = parseError(what);
    return std::nullopt;
  };
  if (!bytes.has_value()) return fail("is missing");
  const auto span = bytes->bytes();
  if (span.empty()) return fail("is empty");
  if (span.size() > kMostFileBytes) return fail("is too large");
  const std::string_view text(reinterpret_cast<const char*>(span.data()), span.size());
  // Check before the library sees a byte, because the library recurses, copies shared objects, and
  // ends the process by assertions.
  if (const auto reason = whyUnreadable(text, kBounds)) return fail(*reason);
  List list;
  const auto length = static_cast<std::uint32_t>(text.size());
  if (isBinaryPropertyList(text)) {
    plist_from_bin(text.data(), length, list.out());
  } else {
    plist_from_xml(text.data(), length, list.out());
  }
  if (!list) return fail("cannot be parsed: it is neither valid XML nor valid binary");
  // Check the result once more, because the shape only estimates how the library reads the bytes.
  bool isTooDeep = false;
  Value root = convert(list.get(), kBounds.depth, isTooDeep);
  if (isTooDeep) return fail("is nested too deeply");
  return root;
}

}  // namespace halvox::platform::linux_
