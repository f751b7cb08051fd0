#include "platform/linux/connection/Introspection.h"

#include "platform/linux/connection/StandardInterfaces.h"
#include "platform/linux/connection/wire/EndedSignal.h"
#include "platform/linux/connection/wire/Signature.h"

namespace halvox::platform::linux_ {
namespace {

constexpr std::string_view kDocumentType =
    "<!DOCTYPE node PUBLIC \"-//freedesktop//DTD D-BUS Object Introspection 1.0//EN\"\n"
    "\"http://www.freedesktop.org/standards/dbus/1.0/introspect.dtd\">\n";

void appendArguments(std::string& xml, std::string_view signature, std::string_view direction) {
  while (!signature.empty()) {
    const std::size_t length = dbus::firstTypeLength(signature);
    xml += "   <arg type=\"";
    xml += signature.substr(0, length);
    xml += "\" direction=\"";
    xml += direction;
    xml += "\"/>\n";
    signature.remove_prefix(length);
  }
}

template <typename Method>
void appendMethod(std::string& xml, const Method& method) {
  xml += "  <method name=\"";
  xml += method.name;
  xml += "\">\n";
  appendArguments(xml, method.in, "in");
  appendArguments(xml, method.out, "out");
  xml += "  </method>\n";
}

void openInterface(std::string& xml, std::string_view name) {
  xml += " <interface name=\"";
  xml += name;
  xml += "\">\n";
}

void appendStandardInterfaces(std::string& xml, bool isObject) {
  std::string_view open;
  for (const StandardMethod& method : objectMethods()) {
    // A parent of the object has no properties, but answers Peer and Introspectable.
    if (method.scope == StandardScope::kObject && !isObject) continue;
    if (method.interface != open) {
      if (!open.empty()) xml += " </interface>\n";
      openInterface(xml, method.interface);
      open = method.interface;
    }
    appendMethod(xml, method);
  }
  if (!open.empty()) xml += " </interface>\n";
}

void appendConnectionInterface(std::string& xml) {
  openInterface(xml, dbus::kConnectionInterface);
  xml += "  <signal name=\"";
  xml += dbus::kEndedSignal;
  xml += "\">\n   <arg type=\"";
  xml += dbus::kEndedSignature;
  xml += "\"/>\n  </signal>\n </interface>\n";
}

// `path` is a parent of the object. Returns the name of its only child, which is the next element
// of `objectPath`.
std::string_view childOf(std::string_view path, std::string_view objectPath) {
  const std::size_t start = path == "/" ? 1 : path.size() + 1;
  return objectPath.substr(start, objectPath.find('/', start) - start);
}

}  // namespace

std::string introspectionOf(const NSXPCInterface& interface, std::string_view path) {
  const bool isObject = path == interface.objectPath;
  std::string xml(kDocumentType);
  xml += "<node>\n";
  appendStandardInterfaces(xml, isObject);
  if (isObject) {
    appendConnectionInterface(xml);
    openInterface(xml, interface.name);
    for (const InterfaceMethod& method : interface.methods) appendMethod(xml, method);
    xml += " </interface>\n";
  } else if (isParentPath(path, interface.objectPath)) {
    xml += " <node name=\"";
    xml += childOf(path, interface.objectPath);
    xml += "\"/>\n";
  }
  return xml += "</node>\n";
}

}  // namespace halvox::platform::linux_
