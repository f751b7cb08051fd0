#include "client/EncodedArray.h"

#include "client/EncodedDictionary.h"

namespace halvox::client {

EncodedArray::EncodedArray() { atFour_.setEnd(put(atFour_.reserve(kFour), std::uint32_t{0})); }

void EncodedArray::reserve(std::size_t room) {
  atEight_.reserve(room);
  atFour_.reserve(room);
}

template <typename WireForm>
void EncodedArray::appendVariant(const WireForm& value) {
  reserve(variantRoom(value));
  atEight_.setEnd(putVariant(atEight_.reserve(0), value));
  atFour_.setEnd(putVariant(atFour_.reserve(0), value));
  levels_ = std::max(levels_, variantLevels(value));
  ++size_;
}

template void EncodedArray::appendVariant(const WireNumber& value);
template void EncodedArray::appendVariant(const platform::Date& value);
template void EncodedArray::appendVariant(const WireData& value);

void EncodedArray::append(const EncodedArray& array) {
  // Reserve before using the elements of `array`. It may be this array, and reserving may move its
  // elements.
  reserve(variantRoom(array.wireForm()));
  appendVariant(array.wireForm());
}

void EncodedArray::append(const EncodedDictionary& dictionary) {
  appendVariant(dictionary.wireForm());
}

bool EncodedArray::append(std::string_view text) {
  if (!isWireText(text)) return false;
  appendVariant(WireText{text});
  return true;
}

}  // namespace halvox::client
