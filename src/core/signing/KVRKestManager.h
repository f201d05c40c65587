#pragma once

#include "platform/Platform.h"
#include "platform/services/DeviceAttestation.h"

#include <functional>
#include <memory>
#include <mutex>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

namespace kvr {

/// Proves that a request comes from this device: a key that the attestation service has bound to the device
/// signs the request's body, and the certificate chain that attests the key is sent along.
///
/// A manager serves one request, on one thread, which it blocks while the service works: first
/// `generateKestCertficate`, then `addKestAuthenticationHeadersToRequest`. There are two kinds of
/// certificate: the preferred one (WELD), and the fallback (HASP) for a device that lacks the former.
///
/// An answer of the service may safely come after the time limit, even if the manager no longer exists.
class KVRKestManager {
 public:
  /// What the service answered: the chain and the key that the manager now holds, or the error. Called on the
  /// service's thread, at most once, and possibly after `generateKestCertficate` has returned.
  using GenerateCompletion =
      std::function<void(const std::optional<CertificateChain>& chain, const AttestedKeyRef& key,
                         const std::optional<Error>& error)>;

  static constexpr std::string_view kSignatureHeader = "X-Tarsil-Kest-S";
  static constexpr std::string_view kCertificateHeader = "X-Tarsil-Kest";

  explicit KVRKestManager(Platform& platform);
  KVRKestManager(const KVRKestManager&) = delete;
  KVRKestManager& operator=(const KVRKestManager&) = delete;

  /// Whether a key and a chain were obtained and stored. Blocks for up to 60 seconds; not to be called on a
  /// thread that the attestation service needs for its answer.
  bool generateKestCertficate(GenerateCompletion completion);

  /// Sets the headers that can be made for `withBody`; true when both could. Otherwise `error` says why.
  bool addKestAuthenticationHeadersToRequest(HTTPRequest& request, std::string_view withBody,
                                             std::optional<Error>& error) const;

  /// The base64 signature, or nothing and the reason in `status`.
  std::optional<std::string> signDataAndEncodeToBase64(std::string_view data,
                                                       const AttestedKeyRef& withPrivateKey,
                                                       std::optional<Error>& status) const;

  /// The chain as a header value: base64 of the compressed list of certificates; or nothing and the reason.
  std::optional<std::string> certificatesEncodeToBase64(const CertificateChain& chain,
                                                        std::optional<Error>& status) const;

  /// Each certificate in base64, in the chain's order. An empty one is left out and logged.
  std::vector<std::string> serializeCertificateChain(const CertificateChain& chain) const;

  /// `{"certs":[…]}` as a raw DEFLATE stream.
  Result<std::string> _compressCertificates(const std::vector<std::string>& certificates) const;

  /// A raw DEFLATE stream without header or checksum. It must not be longer than `data`: what does not shrink
  /// is an error in domain "zlib".
  Result<std::string> _zlibCompressionForData(std::string_view data) const;

  /// Diagnostic: leaves leaf and intermediate certificate in /tmp, in DER form.
  void writeCertsToDevice(const CertificateChain& chain) const;

  /// The leaf, then its issuer; nothing before a certificate has been obtained.
  std::optional<CertificateChain> clientCertArray() const;
  AttestedKeyRef privateKey() const;

 private:
  /// What the service issued; shared with answers still to come.
  struct Credentials {
    mutable std::mutex mutex;  ///< guards the members below
    std::optional<CertificateChain> clientCertArray;
    AttestedKeyRef privateKey;
  };
  class Issue;

  Platform& platform_;
  const std::shared_ptr<Credentials> credentials_ = std::make_shared<Credentials>();
};

}  // namespace kvr
