#pragma once

#include <string>
#include <vector>

namespace kvr::client {

/// The result of one check.
struct Verdict {
  enum State { Fine, Doubtful, Broken };

  std::string subject;
  State state = Fine;
  std::string finding;
  std::string cure;  ///< empty when there is nothing to do
};

/// Checks everything that the agent and its clients need: bus, agent, entitlement, device root, files, clock
/// and endpoints; to an endpoint it only connects. Changes nothing; takes a few seconds at most.
std::vector<Verdict> examine();

}  // namespace kvr::client
