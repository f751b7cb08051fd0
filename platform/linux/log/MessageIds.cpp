#include "platform/linux/log/MessageIds.h"

#include <algorithm>
#include <array>

namespace halvox::platform::linux_ {
namespace {

struct KnownLine {
  std::string_view unit;  // the name before the colon of the prefix
  std::string_view part;  // of the text after the prefix
  std::string_view id;
};

// The lines that an operator acts on. An identifier keeps its meaning for ever: other programs
// select entries by it. packaging/journal/halvox.catalog explains each of them.
constexpr std::array<KnownLine, 21> kKnownLines{{
    {"SqliteStore", "the database is damaged: ", "f0706cb0ffc74cf1a8944b08cfb37cf9"},
    {"StoreOpening", "the database is damaged: ", "f0706cb0ffc74cf1a8944b08cfb37cf9"},
    {"SqliteStore", " records dropped since records were last stored",
     "d7df893ea2b949cdbe91d11482d1238a"},
    {"SqliteStore", "storing again after a failure", "f6abf29de03447e688fe90848917fa03"},
    {"SqliteStore", "the database file was removed or replaced",
     "c6a9015376354d359494e2fe184a7418"},
    {"LinuxPlatform", "the queues have not finished in time", "b5de9cf4580943b39dd93180290cf819"},
    {"LinuxPlatform", "serving ", "9f7474ce83ed4e9782ed47c1202910f3"},
    {"ConnectionHost", "cannot join the bus that started the service",
     "fe0f96e988c04bfaac756dda20a23c90"},
    {"BusConnection", "lost the bus: ", "682ff0faa05241be9b5f7e1cb0b7e3a8"},
    {"ListeningSocket", "cannot accept connections (", "a3651bc40b6b4dfd9e3e998942b9af06"},
    {"ClientConnection", "refused a request of ", "deb04df5d89c44f3be78046b59ab88e4"},
    {"NatsLink", "cannot connect to a NATS server", "3c286857131444f2b8fbcf7d812490b4"},
    {"NatsLink", "lost the connection to NATS", "a1f3b77d79a14bd4bbb52dd230a4d8f8"},
    {"NatsLink", "connected to NATS", "3acf42024f7e44128bc4d6a3291d00fd"},
    {"NatsLink", "NATS accepts no messages", "0fff2307f5e043fa9b7e05a2955a4f7b"},
    {"NatsLink", " messages were not delivered to NATS", "0e2b3fff4a064ac48c69fdd894d0c798"},
    {"QueuedLogService", " lines were dropped: the reader of the log is too slow",
     "ddfec81f309543d9ae0dc1a728aca6f8"},
    {"InotifyNotifyService", "cannot watch the directories of the settings",
     "b81982d05d9b46ee949f9d81d257827e"},
    {"SourceReader", " did not answer within ", "39419a21188d4d19b53aaae225cce77c"},
    {"TextfileSource", "driver counters of ", "ab4c6fe8a34e4da4b83651325efacad1"},
    {"LttngKtraceService", "cannot start a kernel trace", "26ab7284838041529a600fbba24d8ce8"},
}};

}  // namespace

std::string_view messageId(std::string_view line) {
  const std::size_t colon = line.find(':');
  if (colon == std::string_view::npos) return {};
  const std::string_view unit = line.substr(std::min(line.find_first_not_of(' '), colon));
  const std::string_view text = line.substr(colon);
  for (const KnownLine& known : kKnownLines) {
    if (unit.starts_with(known.unit) && unit.substr(known.unit.size()).starts_with(':') &&
        text.find(known.part) != std::string_view::npos) {
      return known.id;
    }
  }
  return {};
}

}  // namespace halvox::platform::linux_
