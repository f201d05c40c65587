#pragma once

#include <optional>
#include <string>

namespace kvr::coverage_service {

/// The two attestation headers of a request and what they attest.
struct Attestation {
  std::string signature;
  std::string chain;
  std::string body;
};

/// What is wrong with an attestation; nothing when it is valid. `authority` is the content of a certificate
/// file, PEM or DER; without it the chain's issuer is not checked.
std::optional<std::string> faultOf(const Attestation& attestation,
                                   const std::optional<std::string>& authority);

}  // namespace kvr::coverage_service
