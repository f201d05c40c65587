#pragma once

#include "local/device/DelayedAnswers.h"
#include "local/device/DeviceRoot.h"
#include "local/keys/LocalKeyStore.h"
#include "platform/services/DeviceAttestation.h"
#include "platform/services/DeviceProperties.h"

namespace kvr {

/// Attests this device by certificates of a local authority (see `LocalKeyStore`).
///
/// "Attestation.plist" of the device root tells, at every question, how the service behaves: `Supported`;
/// `PreferredError` and `FallbackError`, the code with which a request for that kind of certificate fails (0
/// for none); `Delay` in seconds before an answer; `OmitChain` for a key that comes without its chain.
///
/// Destruction fails every request under way and returns when all have been answered.
class LocalDeviceAttestation : public DeviceAttestation {
 public:
  LocalDeviceAttestation(const DeviceRoot& root, const DeviceProperties& properties, Files& files,
                         const Clock& clock, Log& log);

  bool isSupported() const override;
  Result<std::shared_ptr<const KeyAccessControl>> newAccessControl() override;
  void issueClientCertificate(const AttestationOptions& options, Reply reply) override;

 private:
  void answer(const AttestationOptions& options, const Value& behaviour, const Reply& reply);
  DistinguishedName subjectFor(const AttestationOptions& options) const;

  const DeviceRoot& root_;
  const DeviceProperties& properties_;
  LocalKeyStore keys_;
  DelayedAnswers answers_;  ///< last: its answers use what stands above
};

}  // namespace kvr
