#pragma once

#include "integration/support/ChildProcess.h"
#include "integration/support/TemporaryDirectory.h"

#include <string>

namespace kvr::testing {

/// A message bus of the test's own: the reference daemon as a session bus that allows its user everything.
/// Its limit on a message's size is the daemon's default, the strictest an agent is likely to meet.
class PrivateBus {
 public:
  PrivateBus();

  /// Has the bus start a program when somebody calls the name.
  void addService(const std::string& name, const std::string& command) const;
  /// The bus itself; what the programs it starts print as errors is printed there.
  ChildProcess& daemon() { return daemon_; }
  const std::string& address() const { return address_; }
  /// Ends the bus the hard way; every connection is lost.
  void kill() { daemon_.kill(); }

 private:
  TemporaryDirectory directory_;
  ChildProcess daemon_;
  std::string address_;
};

}  // namespace kvr::testing
