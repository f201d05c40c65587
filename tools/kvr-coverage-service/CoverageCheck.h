#pragma once

#include "ReceivedRequest.h"
#include "platform/value/Value.h"

#include <optional>
#include <string>

namespace kvr::coverage_service {

/// What a coverage request is held against.
struct Expectations {
  bool isForLocalDevice = false;          ///< so that it may, or must, be attested
  bool needsAttestation = false;          ///< if it is for the local device
  std::optional<std::string> authority;   ///< the content of the file that attestations are traced to
  std::optional<Value> accounts;          ///< the user's accounts; without them only forms are checked
  std::optional<std::string> storefront;  ///< what takes the place of the account's own
  double now = 0;                         ///< seconds since 1970
};

/// The first rule that a coverage request breaks; nothing for a good one.
std::optional<std::string> faultOf(const ReceivedRequest& request, const Expectations& expectations);

}  // namespace kvr::coverage_service
