#pragma once

#include "platform/value/Error.h"

#include <cstdint>
#include <functional>
#include <memory>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

namespace kvr {

/// The private half of an attested key; it never leaves the key service.
class AttestedKey {
 public:
  virtual ~AttestedKey() = default;
  /// ECDSA with SHA-256 over the message, in X9.62 DER form.
  virtual Result<std::string> sign(std::string_view message) const = 0;
};

using AttestedKeyRef = std::shared_ptr<const AttestedKey>;
/// Certificates as DER bytes, the leaf first.
using CertificateChain = std::vector<std::string>;

/// Who may use a key and when: after the first unlock since boot, on this device only, for private-key
/// operations only.
class KeyAccessControl {
 public:
  virtual ~KeyAccessControl() = default;
};

struct AttestationOptions {
  std::string label;
  std::string accessGroup;
  bool includesIssuer = true;
  double networkTimeout = 60;  ///< seconds
  bool usesFallbackKind = false;
  std::int64_t validity = 0;  ///< minutes
  std::shared_ptr<const KeyAccessControl> accessControl;
  std::vector<std::string> identifierGroups;
};

/// Issues keys with certificates that attest the device. Any thread.
class DeviceAttestation {
 public:
  static constexpr std::string_view kErrorDomain = "com.tarsil.attestation";

  // The groups of device identifiers that a certificate may attest.
  static constexpr std::string_view kWELDDeviceIdentifiers = "WELDDeviceIdentifiers";
  static constexpr std::string_view kDeviceIdentifiers = "DeviceIdentifiers";
  static constexpr std::string_view kHardwareProperties = "HardwareProperties";
  static constexpr std::string_view kAccessControls = "AccessControls";
  static constexpr std::string_view kDeviceOSInformation = "DeviceOSInformation";

  using Reply = std::function<void(AttestedKeyRef key, std::optional<CertificateChain> chain,
                                   std::optional<Error> error)>;

  virtual ~DeviceAttestation() = default;
  virtual bool isSupported() const = 0;
  virtual Result<std::shared_ptr<const KeyAccessControl>> newAccessControl() = 0;
  /// `reply` is called exactly once, on a thread of the service's own, possibly very late.
  virtual void issueClientCertificate(const AttestationOptions& options, Reply reply) = 0;
};

}  // namespace kvr
