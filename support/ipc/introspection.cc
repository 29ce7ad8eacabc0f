// The format is that of the D-Bus specification, "Introspection Data Format".
#include <string>
#include <string_view>
#include <vector>

#include "support/ipc/arguments.h"

namespace spacekeep::ipc {

namespace {

std::string escaped(std::string_view text) {
  std::string result;
  for (const char c : text) {
    switch (c) {
      case '&':
        result += "&amp;";
        break;
      case '<':
        result += "&lt;";
        break;
      case '>':
        result += "&gt;";
        break;
      case '"':
        result += "&quot;";
        break;
      default:
        result += c;
    }
  }
  return result;
}

void addArguments(std::string& xml, const std::vector<ArgumentDescription>& arguments,
                  std::string_view direction) {
  for (const ArgumentDescription& argument : arguments) {
    xml += "      <arg name=\"" + escaped(argument.name) + "\" type=\"";
    xml += signatureOf(argument.kind);
    xml += "\" direction=\"" + std::string(direction) + "\"/>\n";
  }
}

void addMethod(std::string& xml, const MethodDescription& method) {
  xml += "    <method name=\"" + escaped(method.name) + "\">\n";
  addArguments(xml, method.in, "in");
  addArguments(xml, method.out, "out");
  xml += "    </method>\n";
}

// What D-Bus itself asks of every object.
constexpr std::string_view kStandardInterfaces =
    "  <interface name=\"org.freedesktop.DBus.Introspectable\">\n"
    "    <method name=\"Introspect\">\n"
    "      <arg name=\"xml_data\" type=\"s\" direction=\"out\"/>\n"
    "    </method>\n"
    "  </interface>\n"
    "  <interface name=\"org.freedesktop.DBus.Peer\">\n"
    "    <method name=\"Ping\"/>\n"
    "    <method name=\"GetMachineId\">\n"
    "      <arg name=\"machine_uuid\" type=\"s\" direction=\"out\"/>\n"
    "    </method>\n"
    "  </interface>\n";

}  // namespace

std::string introspectionXml(const InterfaceDescription& interface) {
  std::string xml = "<node>\n";
  for (const auto* each = &interface; each != nullptr; each = each->beside) {
    xml += "  <interface name=\"" + escaped(each->name) + "\">\n";
    for (const MethodDescription& method : each->methods) addMethod(xml, method);
    xml += "  </interface>\n";
  }
  xml += kStandardInterfaces;
  xml += "</node>\n";
  return xml;
}

}  // namespace spacekeep::ipc
