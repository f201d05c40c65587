#include "local/bus/BusIntrospection.h"

#include "local/bus/BusObservers.h"

namespace kvr {
namespace {

constexpr std::string_view kHead =
    R"(<!DOCTYPE node PUBLIC "-//freedesktop//DTD D-BUS Object Introspection 1.0//EN"
 "http://www.freedesktop.org/standards/dbus/1.0/introspect.dtd">
<node>
 <interface name="org.freedesktop.DBus.Peer">
  <method name="Ping"/>
  <method name="GetMachineId">
   <arg type="s" name="machine_uuid" direction="out"/>
  </method>
 </interface>
 <interface name="org.freedesktop.DBus.Introspectable">
  <method name="Introspect">
   <arg name="xml_data" type="s" direction="out"/>
  </method>
 </interface>
)";

constexpr std::string_view kSignal =
    R"(  <signal name="Changed">
   <arg type="as" name="records"/>
   <arg type="as" name="followUps"/>
   <arg type="b" name="devices"/>
  </signal>
)";

void appendArgument(std::string& document, const ServiceArgument& argument, const char* direction) {
  document.append("   <arg type=\"").append(argument.type).append("\" name=\"").append(argument.name);
  document.append("\" direction=\"").append(direction).append("\"/>\n");
}

void appendInterface(std::string& document, const ServiceInterface& interface, std::string_view signals) {
  document.append(" <interface name=\"").append(interface.name).append("\">\n");
  for (const ServiceMethod& method : interface.methods) {
    document.append("  <method name=\"").append(method.member).append("\">\n");
    for (const ServiceArgument& argument : method.in) appendArgument(document, argument, "in");
    appendArgument(document, method.out, "out");
    document.append("  </method>\n");
  }
  document.append(signals).append(" </interface>\n");
}

}  // namespace

std::string introspectionDocument(const ServiceInterface& interface) {
  std::string document(kHead);
  appendInterface(document, interface, "");
  appendInterface(document, changesInterface(), kSignal);
  return document.append("</node>\n");
}

std::string signatureOf(const ServiceMethod& method) {
  std::string signature;
  for (const ServiceArgument& argument : method.in) signature += argument.type;
  return signature;
}

}  // namespace kvr
