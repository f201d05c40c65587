#include "local/keys/LocalDeviceAttestation.h"

#include "platform/text/SHA256Hash.h"

#include <openssl/objects.h>

#include <algorithm>
#include <array>
#include <cerrno>
#include <utility>

namespace kvr {

namespace {

constexpr std::string_view kFile = "Attestation.plist";

/// Empty: the keys are files on this device that only the user's own processes can read, so there is no
/// access to grant.
class LocalKeyAccessControl : public KeyAccessControl {};

double secondsIn(const Value& value) { return value.isNumber() ? value.asDouble() : 0; }

std::int64_t codeIn(const Value& value) { return value.kind() == Value::Kind::Int ? value.integer() : 0; }

bool includes(const AttestationOptions& options, std::string_view group) {
  return std::find(options.identifierGroups.begin(), options.identifierGroups.end(), group) !=
         options.identifierGroups.end();
}

}  // namespace

LocalDeviceAttestation::LocalDeviceAttestation(const DeviceRoot& root, const DeviceProperties& properties,
                                               Files& files, const Clock& clock, Log& log)
    : root_(root), properties_(properties), keys_(files, clock, log), answers_(log) {}

bool LocalDeviceAttestation::isSupported() const {
  const auto supported = root_.dictionary(kFile)["Supported"];
  return !supported.isBool() || supported.boolean();
}

Result<std::shared_ptr<const KeyAccessControl>> LocalDeviceAttestation::newAccessControl() {
  return std::shared_ptr<const KeyAccessControl>(std::make_shared<LocalKeyAccessControl>());
}

void LocalDeviceAttestation::issueClientCertificate(const AttestationOptions& options, Reply reply) {
  const Value behaviour = root_.dictionary(kFile);
  answers_.after(
      secondsIn(behaviour["Delay"]), [this, options, behaviour, reply = std::move(reply)](bool ending) {
        if (ending) {
          reply(nullptr, std::nullopt, Error{"keys", ECANCELED, "the attestation service is ending"});
        } else {
          answer(options, behaviour, reply);
        }
      });
}

void LocalDeviceAttestation::answer(const AttestationOptions& options, const Value& behaviour,
                                    const Reply& reply) {
  const auto code = codeIn(behaviour[options.usesFallbackKind ? "FallbackError" : "PreferredError"]);
  if (code != 0) {
    reply(nullptr, std::nullopt,
          Error{std::string(kErrorDomain), code, "the device has no certificate of this kind"});
    return;
  }
  const auto credentials = keys_.credentialsFor({.label = options.label,
                                                 .kind = options.usesFallbackKind ? "fallback" : "preferred",
                                                 .subject = subjectFor(options),
                                                 .validity = options.validity});
  if (!credentials) {
    reply(nullptr, std::nullopt, credentials.error());
    return;
  }
  std::optional<CertificateChain> chain;
  if (behaviour["OmitChain"] != Value(true)) {
    chain = CertificateChain{credentials->leaf};
    if (options.includesIssuer) chain->push_back(credentials->issuer);
  }
  reply(credentials->key, std::move(chain), std::nullopt);
}

/// How the certificate describes the device: only by what was asked for, and by nothing that changes with an
/// update of the operating system.
DistinguishedName LocalDeviceAttestation::subjectFor(const AttestationOptions& options) const {
  DistinguishedName subject = {{NID_commonName, options.label},
                               {NID_organizationalUnitName, options.usesFallbackKind ? "HASP" : "WELD"}};
  if (includes(options, kDeviceIdentifiers)) {
    if (const auto serialNumber = properties_.answer(DeviceProperties::kSerialNumber)) {
      // Only the hash, because a certificate is passed on further than the request it is sent with.
      subject.emplace_back(NID_serialNumber, sha256Digits(*serialNumber));
    }
  }
  if (includes(options, kHardwareProperties)) {
    if (const auto productType = properties_.answer(DeviceProperties::kProductType)) {
      subject.emplace_back(NID_description, *productType);
    }
  }
  return subject;
}

}  // namespace kvr
