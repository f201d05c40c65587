#pragma once

#include "platform/services/DeviceAttestation.h"
#include "platform/services/WorkQueues.h"

#include <memory>
#include <optional>
#include <string>
#include <utility>
#include <vector>

namespace kvr {

/// Returns `signature` for every message.
class SimulatedAttestedKey : public AttestedKey {
 public:
  Result<std::string> signature = std::string("signature");
  mutable std::vector<std::string> messages;  ///< all signed ones, in order

  Result<std::string> sign(std::string_view message) const override {
    messages.emplace_back(message);
    return signature;
  }
};

/// Issues what the test sets, one outcome per kind of certificate.
class SimulatedDeviceAttestation : public DeviceAttestation {
 public:
  struct Outcome {
    AttestedKeyRef key;
    std::optional<CertificateChain> chain;
    std::optional<Error> error;
    double delay = 0;  ///< seconds
    bool never = false;
  };

  explicit SimulatedDeviceAttestation(WorkQueues& queues)
      : queues_(queues), queue_(queues.newSerialQueue("device attestation")) {}

  static Outcome issued(AttestedKeyRef key, CertificateChain chain, double delay = 0) {
    return {std::move(key), std::move(chain), std::nullopt, delay, false};
  }
  static Outcome failed(std::int64_t code, double delay = 0) {
    return {nullptr, std::nullopt, Error{std::string(kErrorDomain), code, "not issued"}, delay, false};
  }

  bool supported = true;
  std::optional<Error> accessControlError;
  /// The key of both outcomes until the test replaces them.
  const std::shared_ptr<SimulatedAttestedKey> key = std::make_shared<SimulatedAttestedKey>();
  Outcome preferred = issued(key, {"leaf", "issuer"});
  Outcome fallback = issued(key, {"fallback leaf", "fallback issuer"});
  std::vector<AttestationOptions> requests;  ///< all requests, in order

  bool isSupported() const override { return supported; }
  Result<std::shared_ptr<const KeyAccessControl>> newAccessControl() override {
    if (accessControlError) return *accessControlError;
    return std::make_shared<const KeyAccessControl>();
  }
  void issueClientCertificate(const AttestationOptions& options, Reply reply) override {
    requests.push_back(options);
    const Outcome& outcome = options.usesFallbackKind ? fallback : preferred;
    if (outcome.never) {
      unanswered_.push_back(std::move(reply));
      return;
    }
    queues_.after(outcome.delay, queue_,
                  [outcome, reply = std::move(reply)] { reply(outcome.key, outcome.chain, outcome.error); });
  }

 private:
  WorkQueues& queues_;
  const WorkQueueRef queue_;
  std::vector<Reply> unanswered_;
};

}  // namespace kvr
