#pragma once

#include "integration/support/ChildProcess.h"
#include "integration/support/TemporaryDirectory.h"

namespace kvr::testing {

/// A private message bus: the reference daemon as a session bus that allows its user everything. Its limit on
/// message sizes is the daemon's default, the strictest an agent is likely to meet.
class PrivateBus {
 public:
  /// Makes the bus start a program when somebody calls the name.
  void addService(const std::string& name, const std::string& command) const {
    directory_.write("services/" + name + ".service",
                     "[D-BUS Service]\nName=" + name + "\nExec=" + command + "\n");
  }
  /// The daemon; its error output includes that of the programs it starts.
  ChildProcess& daemon() { return daemon_; }
  const std::string& address() const { return address_; }
  const std::filesystem::path& directory() const { return directory_.path(); }
  /// Kills the bus; every connection is lost.
  void kill() { daemon_.kill(); }

 private:
  TemporaryDirectory directory_;
  const std::string configuration_ = directory_.write("bus.conf", R"(<!DOCTYPE busconfig PUBLIC
 "-//freedesktop//DTD D-Bus Bus Configuration 1.0//EN"
 "http://www.freedesktop.org/standards/dbus/1.0/busconfig.dtd">
<busconfig>
  <type>session</type>
  <listen>unix:dir=)" + directory_.path().string() + R"(</listen>
  <servicedir>)" + (directory_ / "services").string() + R"(</servicedir>
  <auth>EXTERNAL</auth>
  <policy context="default">
    <allow send_destination="*" eavesdrop="true"/>
    <allow eavesdrop="true"/>
    <allow own="*"/>
    <allow user="*"/>
  </policy>
  <limit name="max_connections_per_user">100000</limit>
  <limit name="max_completed_connections">100000</limit>
  <limit name="max_match_rules_per_connection">50000</limit>
  <limit name="max_replies_per_connection">50000</limit>
</busconfig>
)");
  ChildProcess daemon_{
      {"dbus-daemon", "--config-file=" + configuration_, "--nofork", "--nopidfile", "--print-address=1"}};
  const std::string address_ = daemon_.waitForOutput("unix:");
};

}  // namespace kvr::testing
