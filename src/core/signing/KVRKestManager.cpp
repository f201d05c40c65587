#include "core/signing/KVRKestManager.h"

#include "platform/codec/JSON.h"
#include "platform/text/Base64.h"

#include <zlib.h>

#include <atomic>
#include <limits>
#include <utility>

namespace kvr {

namespace {

constexpr std::string_view kGenerate = "-[KVRKestManager generateKestCertficate:]";
constexpr std::string_view kAddHeaders =
    "-[KVRKestManager addKestAuthenticationHeadersToRequest:withBody:error:]";
constexpr std::string_view kSerialize = "-[KVRKestManager serializeCertificateChain:]";
constexpr std::string_view kWriteCerts = "-[KVRKestManager writeCertsToDevice:]";

constexpr int kTimeLimit = 60;             ///< seconds, for both certificate requests together
constexpr std::int64_t kValidity = 43200;  ///< minutes: 30 days

/// The two ways in which the attestation service says that the device has no certificate of the preferred
/// kind.
bool isMissingPreferredCertificate(const Error& error) {
  return error.domain == DeviceAttestation::kErrorDomain && (error.code == -11 || error.code == -4);
}

AttestationOptions attestationOptions(std::shared_ptr<const KeyAccessControl> accessControl) {
  return {.label = "com.tarsil.kvragent.kestCertificates",
          .accessGroup = "com.tarsil.kvragent",
          .includesIssuer = true,
          .networkTimeout = kTimeLimit,
          .usesFallbackKind = false,
          .validity = kValidity,
          .accessControl = std::move(accessControl),
          .identifierGroups = {std::string(DeviceAttestation::kWELDDeviceIdentifiers),
                               std::string(DeviceAttestation::kDeviceIdentifiers),
                               std::string(DeviceAttestation::kHardwareProperties),
                               std::string(DeviceAttestation::kAccessControls),
                               std::string(DeviceAttestation::kDeviceOSInformation)}};
}

}  // namespace

/// One request for a certificate, alive until the service has given its last answer.
class KVRKestManager::Issue : public std::enable_shared_from_this<Issue> {
 public:
  Issue(Platform& platform, std::shared_ptr<Credentials> credentials, AttestationOptions options,
        GenerateCompletion completion)
      : log_(platform.log),
        attestation_(platform.attestation),
        released_(platform.queues.newSignal()),
        credentials_(std::move(credentials)),
        options_(std::move(options)),
        completion_(std::move(completion)) {}

  void start() {
    attestation_.issueClientCertificate(options_,
                                        [self = shared_from_this()](auto key, auto chain, auto error) {
                                          self->preferredAnswered(std::move(key), std::move(chain), error);
                                        });
  }

  bool waitFor(double seconds) { return released_->wait(seconds); }
  bool succeeded() const { return succeeded_; }

 private:
  void preferredAnswered(AttestedKeyRef key, std::optional<CertificateChain> chain,
                         const std::optional<Error>& error) {
    if (error && isMissingPreferredCertificate(*error)) {
      log_.error("%s: Kest (WELD) failed due to missing WELD with error: %@, falling back to Kest (HASP)",
                 kGenerate, *error);
      startFallback();
      return;
    }
    if (error) {
      completion_(std::nullopt, nullptr, error);
      released_->signal();
      return;
    }
    if (!store(std::move(key), std::move(chain))) {
      log_.error("%s: Failed to get reference key or cert!", kGenerate);
    }
    finish(std::nullopt);
  }

  void startFallback() {
    auto options = options_;
    options.usesFallbackKind = true;
    attestation_.issueClientCertificate(options,
                                        [self = shared_from_this()](auto key, auto chain, auto error) {
                                          self->store(std::move(key), std::move(chain));
                                          self->finish(error);
                                        });
  }

  bool store(AttestedKeyRef key, std::optional<CertificateChain> chain) {
    if (!key || !chain) return false;
    const std::lock_guard lock(credentials_->mutex);
    credentials_->privateKey = std::move(key);
    credentials_->clientCertArray = std::move(chain);
    succeeded_ = true;
    return true;
  }

  void finish(const std::optional<Error>& error) {
    std::unique_lock lock(credentials_->mutex);
    const auto chain = credentials_->clientCertArray;
    const auto key = credentials_->privateKey;
    lock.unlock();
    completion_(chain, key, error);
    released_->signal();
  }

  Log& log_;
  DeviceAttestation& attestation_;
  const std::shared_ptr<Signal> released_;
  const std::shared_ptr<Credentials> credentials_;
  const AttestationOptions options_;
  const GenerateCompletion completion_;
  std::atomic<bool> succeeded_{false};
};

KVRKestManager::KVRKestManager(Platform& platform) : platform_(platform) {}

bool KVRKestManager::generateKestCertficate(GenerateCompletion completion) {
  const bool isSupported = platform_.attestation.isSupported();
  platform_.log.standard("%s: isSupported: %d", kGenerate, isSupported);
  if (!isSupported) return false;

  const auto accessControl = platform_.attestation.newAccessControl();
  if (!accessControl) {
    platform_.log.error("Failed to create access control: %s", describe(accessControl.error()));
    return false;
  }

  const auto issue = std::make_shared<Issue>(platform_, credentials_, attestationOptions(*accessControl),
                                             std::move(completion));
  issue->start();
  if (!issue->waitFor(kTimeLimit)) {
    platform_.log.standard("%s: Installation timed out after %d seconds", kGenerate, kTimeLimit);
  }
  return issue->succeeded();
}

bool KVRKestManager::addKestAuthenticationHeadersToRequest(HTTPRequest& request, std::string_view withBody,
                                                           std::optional<Error>& error) const {
  std::optional<Error> signingError;
  const auto signature = signDataAndEncodeToBase64(withBody, privateKey(), signingError);
  std::optional<Error> chainError;
  const auto certificates =
      certificatesEncodeToBase64(clientCertArray().value_or(CertificateChain{}), chainError);

  request.headers.set(kSignatureHeader, signature);
  request.headers.set(kCertificateHeader, certificates);
  if (signature && certificates) {
    platform_.log.standard("%s: signatureDataString: %@\n certificateString: %@", kAddHeaders, *signature,
                           *certificates);
    return true;
  }
  error = signingError ? signingError : chainError;
  platform_.log.error("%s: Failed to add Kest Headers with error: %@", kAddHeaders, error);
  return false;
}

std::optional<std::string> KVRKestManager::signDataAndEncodeToBase64(std::string_view data,
                                                                     const AttestedKeyRef& withPrivateKey,
                                                                     std::optional<Error>& status) const {
  const auto signature = withPrivateKey ? withPrivateKey->sign(data)
                                        : Result<std::string>(Error{"kest", 0, "there is no private key"});
  if (signature) return base64Encode(*signature);
  status = signature.error();
  platform_.log.error("Unable to sign data and encode with error: %@", *status);
  return std::nullopt;
}

std::optional<std::string> KVRKestManager::certificatesEncodeToBase64(const CertificateChain& chain,
                                                                      std::optional<Error>& status) const {
  const auto compressed = _compressCertificates(serializeCertificateChain(chain));
  if (compressed) return base64Encode(*compressed);
  status = compressed.error();
  platform_.log.error("Unable to sign request");
  return std::nullopt;
}

std::vector<std::string> KVRKestManager::serializeCertificateChain(const CertificateChain& chain) const {
  std::vector<std::string> certificates;
  certificates.reserve(chain.size());
  for (const auto& certificate : chain) {
    if (certificate.empty()) {
      platform_.log.error("%s: Found NULL attestation data!!", kSerialize);
      continue;
    }
    certificates.push_back(base64Encode(certificate));
  }
  return certificates;
}

Result<std::string> KVRKestManager::_compressCertificates(
    const std::vector<std::string>& certificates) const {
  const Value list{Value::Dictionary{{"certs", Value::Array(certificates.begin(), certificates.end())}}};
  const auto json = writeJSON(list, JSONSlashes::Escaped);
  if (!json) {
    platform_.log.error("Unable to create attestation data with error: %@", json.error().message);
    return json.error();
  }
  return _zlibCompressionForData(*json);
}

Result<std::string> KVRKestManager::_zlibCompressionForData(std::string_view data) const {
  constexpr int kRawWindowBits = -15;
  constexpr int kMemoryLevel = 8;
  if (data.size() > std::numeric_limits<uInt>::max())
    return Error{"zlib", Z_MEM_ERROR, "too much to compress"};

  z_stream stream{};
  if (const int failure = deflateInit2(&stream, Z_DEFAULT_COMPRESSION, Z_DEFLATED, kRawWindowBits,
                                       kMemoryLevel, Z_DEFAULT_STRATEGY);
      failure != Z_OK) {
    return Error{"zlib", failure, "cannot begin to compress"};
  }
  const std::unique_ptr<z_stream, decltype(&deflateEnd)> ending(&stream, deflateEnd);

  std::string compressed(data.size(), '\0');
  stream.next_in = reinterpret_cast<Bytef*>(const_cast<char*>(data.data()));
  stream.avail_in = static_cast<uInt>(data.size());
  stream.next_out = reinterpret_cast<Bytef*>(compressed.data());
  stream.avail_out = static_cast<uInt>(compressed.size());
  if (const int state = deflate(&stream, Z_FINISH); state != Z_STREAM_END) {
    return Error{"zlib", state, "the compressed form is longer than what it is made of"};
  }
  compressed.resize(stream.total_out);
  return compressed;
}

void KVRKestManager::writeCertsToDevice(const CertificateChain& chain) const {
  if (chain.size() < 2) {
    platform_.log.debug("KVRKestManager: Certificates not present!");
    return;
  }
  const std::pair<const char*, const std::string&> files[] = {{"/tmp/leafCertificate", chain[0]},
                                                              {"/tmp/intermediateCertificate", chain[1]}};
  for (const auto& [path, bytes] : files) {
    if (const auto error = platform_.files.replace(path, bytes)) {
      platform_.log.error("%s: cannot write '%s': %@", kWriteCerts, path, *error);
    }
  }
}

std::optional<CertificateChain> KVRKestManager::clientCertArray() const {
  const std::lock_guard lock(credentials_->mutex);
  return credentials_->clientCertArray;
}

AttestedKeyRef KVRKestManager::privateKey() const {
  const std::lock_guard lock(credentials_->mutex);
  return credentials_->privateKey;
}

}  // namespace kvr
