#pragma once

#include <string>
#include <vector>

namespace kvr::client {

/// One thing that was looked at.
struct Verdict {
  enum State { Fine, Doubtful, Broken };

  std::string subject;
  State state = Fine;
  std::string finding;
  std::string cure;  ///< empty when there is nothing to do
};

/// Looks at all that the agent and its clients need: bus, agent, entitlement, device root, files, clock, and
/// the endpoints, which are connected to and asked for nothing. Changes nothing; takes some seconds at most.
std::vector<Verdict> examine();

}  // namespace kvr::client
