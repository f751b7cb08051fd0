#pragma once

namespace halvox::platform {

class ProtoReader;
class ProtoWriter;
class ProtoTextFormatter;

// A message with a protocol-buffers form.
class ProtoBase {
 public:
  virtual ~ProtoBase() = default;

  // Reads fields until the end; false after an error, with the fields before it read.
  [[nodiscard]] virtual bool readFrom(ProtoReader& reader) = 0;
  virtual void writeTo(ProtoWriter& writer) const = 0;
  virtual void formatText(ProtoTextFormatter& formatter, const char* name) const = 0;

 protected:
  ProtoBase() = default;
  ProtoBase(const ProtoBase&) = default;
  ProtoBase& operator=(const ProtoBase&) = default;
};

}  // namespace halvox::platform
