#pragma once

#include "local/device/DelayedAnswers.h"
#include "local/device/DeviceRoot.h"
#include "local/keys/LocalKeyStore.h"
#include "platform/services/DeviceAttestation.h"
#include "platform/services/DeviceProperties.h"

namespace kvr {

/// Attests this device with certificates of a local authority (see `LocalKeyStore`).
///
/// "Attestation.plist" of the device root, read for each request, controls the behaviour: `Supported`;
/// `PreferredError` and `FallbackError`, the error code of requests for that kind of certificate (0 for
/// none); `Delay` before an answer, in seconds; `OmitChain` to deliver a key without its chain.
///
/// The destructor fails all open requests and returns once all have been answered.
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
  DelayedAnswers answers_;  ///< last: its answers use the members above
};

}  // namespace kvr
