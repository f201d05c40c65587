#include "integration/support/PrivateBus.h"

namespace kvr::testing {
namespace {

std::string configuration(const TemporaryDirectory& directory) {
  return R"(<!DOCTYPE busconfig PUBLIC "-//freedesktop//DTD D-Bus Bus Configuration 1.0//EN"
 "http://www.freedesktop.org/standards/dbus/1.0/busconfig.dtd">
<busconfig>
  <type>session</type>
  <listen>unix:dir=)" +
         directory.path().string() + R"(</listen>
  <servicedir>)" +
         (directory.path() / "services").string() + R"(</servicedir>
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
)";
}

}  // namespace

void PrivateBus::addService(const std::string& name, const std::string& command) const {
  directory_.write("services/" + name + ".service",
                   "[D-BUS Service]\nName=" + name + "\nExec=" + command + "\n");
}

PrivateBus::PrivateBus()
    : daemon_({"dbus-daemon",
               "--config-file=" + directory_.write("bus.conf", configuration(directory_)).string(),
               "--nofork", "--nopidfile", "--print-address=1"}),
      address_(daemon_.waitForOutput("unix:")) {}

}  // namespace kvr::testing
