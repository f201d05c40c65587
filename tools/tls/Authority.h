#pragma once

#include "local/keys/LocalCertificates.h"

#include <string>

namespace kvr::tls {

/// What is wrong with a server's certificate.
enum class Flaw {
  None,
  SelfSigned,  ///< issued by nobody but itself
  Unknown,     ///< issued by another authority
  Elsewhere,   ///< for another host
  Expired,
  Early,  ///< not valid yet
};

/// A certificate authority that lives as long as this object. Throws when OpenSSL fails.
class Authority {
 public:
  Authority();
  /// The authority's own certificate, for those who are to trust it.
  std::string pem() const;
  /// A new key with a certificate for servers on this machine: 127.0.0.1, localhost and coverage.example.
  CertifiedKey issue(Flaw flaw = Flaw::None) const;

 private:
  CertifiedKey own_;
};

}  // namespace kvr::tls
