#pragma once

#include "ReceivedRequest.h"
#include "platform/value/Value.h"

#include <optional>
#include <string>

namespace kvr::coverage_service {

/// What a coverage request is checked against.
struct Expectations {
  bool isForLocalDevice = false;          ///< it may be attested, or must be
  bool needsAttestation = false;          ///< when it is for the local device
  std::optional<std::string> authority;   ///< content of the certificate file that attestations must trace to
  std::optional<Value> accounts;          ///< the user's accounts; without them only the form is checked
  std::optional<std::string> storefront;  ///< replaces the account's own
  double now = 0;                         ///< seconds since 1970
};

/// The first rule that a coverage request breaks; nothing for a correct one.
std::optional<std::string> faultOf(const ReceivedRequest& request, const Expectations& expectations);

}  // namespace kvr::coverage_service
