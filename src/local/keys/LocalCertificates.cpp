#include "local/keys/LocalCertificates.h"

#include <openssl/ec.h>
#include <openssl/pem.h>
#include <openssl/x509v3.h>

#include <algorithm>
#include <cmath>
#include <ctime>

namespace kvr {

using namespace openssl;

namespace {

constexpr std::string_view kCurve = "prime256v1";
constexpr std::time_t kToleratedSetback = 300;  ///< seconds
/// The last second that a certificate can express; it means "never expires".
constexpr double kEndOfTime = 253402300799.0;  // 9999-12-31 23:59:59 UTC

std::time_t secondsOf(Date date) {
  return std::isfinite(date.secondsSince1970)
             ? static_cast<std::time_t>(std::clamp(date.secondsSince1970, 0.0, kEndOfTime))
             : 0;
}

NameHandle nameOf(const DistinguishedName& parts) {
  NameHandle name(X509_NAME_new());
  if (!name) return nullptr;
  for (const auto& [part, text] : parts) {
    const auto* bytes = reinterpret_cast<const unsigned char*>(text.data());
    const auto length = static_cast<int>(std::min<std::size_t>(text.size(), INT32_MAX));
    if (X509_NAME_add_entry_by_NID(name.get(), part, MBSTRING_UTF8, bytes, length, -1, 0) != 1)
      ERR_clear_error();
  }
  return name;
}

bool setRandomSerialNumber(X509* certificate) {
  constexpr int kBits = 127;
  const BignumHandle number(BN_new());
  return number && BN_rand(number.get(), kBits, BN_RAND_TOP_ONE, BN_RAND_BOTTOM_ANY) == 1 &&
         BN_to_ASN1_INTEGER(number.get(), X509_get_serialNumber(certificate)) != nullptr;
}

bool addExtension(X509* certificate, X509* issuer, int identifier, const char* value) {
  X509V3_CTX context{};
  X509V3_set_ctx(&context, issuer, certificate, nullptr, nullptr, 0);
  const ExtensionHandle extension(X509V3_EXT_conf_nid(nullptr, &context, identifier, value));
  return extension && X509_add_ext(certificate, extension.get(), -1) == 1;
}

/// The common part of both kinds of certificate; the caller adds the extensions and the signature.
Certificate newCertificate(const Key& key, X509_NAME* subject, const X509_NAME* issuer, std::time_t begin,
                           std::time_t end) {
  auto certificate = adoptCertificate(X509_new());
  auto* const raw = certificate.get();
  const bool made = raw != nullptr && X509_set_version(raw, X509_VERSION_3) == 1 &&
                    setRandomSerialNumber(raw) && ASN1_TIME_set(X509_getm_notBefore(raw), begin) != nullptr &&
                    ASN1_TIME_set(X509_getm_notAfter(raw), end) != nullptr &&
                    X509_set_subject_name(raw, subject) == 1 && X509_set_issuer_name(raw, issuer) == 1 &&
                    X509_set_pubkey(raw, key.get()) == 1;
  return made ? certificate : nullptr;
}

BioHandle readerOf(std::string_view text) {
  return BioHandle(text.size() > INT32_MAX ? nullptr
                                           : BIO_new_mem_buf(text.data(), static_cast<int>(text.size())));
}

template <class Write>
Result<std::string> written(const Write& write) {
  const BioHandle bio(BIO_new(BIO_s_mem()));
  if (!bio || write(bio.get()) != 1) return lastError("cannot encode");
  char* bytes = nullptr;
  const long length = BIO_get_mem_data(bio.get(), &bytes);
  return std::string(bytes, static_cast<std::size_t>(length));
}

/// There is nobody to ask for a passphrase, so an encrypted key counts as damaged.
int refusePassphrase(char*, int, int, void*) { return -1; }

}  // namespace

Result<Key> newPrivateKey() {
  auto key = adoptKey(EVP_EC_gen(kCurve.data()));
  if (!key) return lastError("cannot make a key");
  return key;
}

Result<Certificate> newAuthorityCertificate(const Key& key) {
  const auto name = nameOf({{NID_commonName, "Local Device Attestation Authority"}});
  auto certificate = name ? newCertificate(key, name.get(), name.get(), 0, secondsOf({kEndOfTime})) : nullptr;
  auto* const raw = certificate.get();
  const bool made = raw != nullptr &&
                    addExtension(raw, raw, NID_basic_constraints, "critical,CA:TRUE,pathlen:0") &&
                    addExtension(raw, raw, NID_key_usage, "critical,keyCertSign,cRLSign") &&
                    addExtension(raw, raw, NID_subject_key_identifier, "hash") &&
                    addExtension(raw, raw, NID_authority_key_identifier, "keyid:always") &&
                    X509_sign(raw, key.get(), EVP_sha256()) > 0;
  if (!made) return lastError("cannot make the authority's certificate");
  return certificate;
}

Result<Certificate> newLeafCertificate(const Key& key, const DistinguishedName& subject,
                                       const CertifiedKey& authority, Date now, std::int64_t validity) {
  const auto name = nameOf(subject);
  auto* const issuer = authority.certificate.get();
  const auto begin = std::max<std::time_t>(secondsOf(now) - kToleratedSetback, 0);
  const auto end = secondsOf(now + static_cast<double>(validity) * 60);
  auto certificate =
      name ? newCertificate(key, name.get(), X509_get_subject_name(issuer), begin, end) : nullptr;
  auto* const raw = certificate.get();
  const bool made = raw != nullptr && addExtension(raw, issuer, NID_basic_constraints, "critical,CA:FALSE") &&
                    addExtension(raw, issuer, NID_key_usage, "critical,digitalSignature") &&
                    addExtension(raw, issuer, NID_ext_key_usage, "clientAuth") &&
                    addExtension(raw, issuer, NID_subject_key_identifier, "hash") &&
                    addExtension(raw, issuer, NID_authority_key_identifier, "keyid:always") &&
                    X509_sign(raw, authority.key.get(), EVP_sha256()) > 0;
  if (!made) return lastError("cannot make a leaf certificate");
  return certificate;
}

bool hasSubject(const Certificate& certificate, const DistinguishedName& subject) {
  const auto name = nameOf(subject);
  return name && X509_NAME_cmp(X509_get_subject_name(certificate.get()), name.get()) == 0;
}

bool isSameCertificate(const Certificate& left, const Certificate& right) {
  return X509_cmp(left.get(), right.get()) == 0;
}

bool belongTogether(const CertifiedKey& pair) {
  const bool matching = X509_check_private_key(pair.certificate.get(), pair.key.get()) == 1;
  ERR_clear_error();
  return matching;
}

Verdict verify(const Certificate& certificate, const Certificate& authority, Date now) {
  const StoreHandle trusted(X509_STORE_new());
  const StoreContextHandle context(X509_STORE_CTX_new());
  if (!trusted || !context || X509_STORE_add_cert(trusted.get(), authority.get()) != 1 ||
      X509_STORE_CTX_init(context.get(), trusted.get(), certificate.get(), nullptr) != 1) {
    ERR_clear_error();
    return Verdict::Bad;
  }
  auto* const parameters = X509_STORE_CTX_get0_param(context.get());
  X509_VERIFY_PARAM_set_time(parameters, secondsOf(now));
  // Also check the authority's own signature, to detect a damaged authority certificate.
  X509_VERIFY_PARAM_set_flags(parameters, X509_V_FLAG_X509_STRICT | X509_V_FLAG_CHECK_SS_SIGNATURE);
  const bool verified = X509_verify_cert(context.get()) == 1;
  ERR_clear_error();
  if (verified) return Verdict::Good;
  switch (X509_STORE_CTX_get_error(context.get())) {
    case X509_V_ERR_CERT_HAS_EXPIRED:
    case X509_V_ERR_CERT_NOT_YET_VALID:
      return Verdict::OutOfDate;
    default:
      return Verdict::Bad;
  }
}

bool isInDate(const Certificate& certificate, Date now) {
  std::time_t time = secondsOf(now);
  return X509_cmp_time(X509_get0_notBefore(certificate.get()), &time) < 0 &&
         X509_cmp_time(X509_get0_notAfter(certificate.get()), &time) > 0;
}

Result<std::string> sign(const Key& key, std::string_view message) {
  const auto* bytes = reinterpret_cast<const unsigned char*>(message.data());
  const DigestContextHandle context(EVP_MD_CTX_new());
  std::size_t length = 0;
  if (!context || EVP_DigestSignInit(context.get(), nullptr, EVP_sha256(), nullptr, key.get()) != 1 ||
      EVP_DigestSign(context.get(), nullptr, &length, bytes, message.size()) != 1) {
    return lastError("cannot sign");
  }
  std::string signature(length, '\0');
  auto* const out = reinterpret_cast<unsigned char*>(signature.data());
  if (EVP_DigestSign(context.get(), out, &length, bytes, message.size()) != 1)
    return lastError("cannot sign");
  signature.resize(length);
  return signature;
}

Result<std::string> derOf(const Certificate& certificate) {
  return written([&](BIO* bio) { return i2d_X509_bio(bio, certificate.get()); });
}

Result<std::string> pemOf(const Certificate& certificate) {
  return written([&](BIO* bio) { return PEM_write_bio_X509(bio, certificate.get()); });
}

Result<std::string> pemOf(const Key& key) {
  return written([&](BIO* bio) {
    return PEM_write_bio_PKCS8PrivateKey(bio, key.get(), nullptr, nullptr, 0, nullptr, nullptr);
  });
}

std::vector<Certificate> certificatesInPEM(std::string_view text) {
  std::vector<Certificate> certificates;
  const auto reader = readerOf(text);
  if (!reader) return {};
  while (auto certificate =
             adoptCertificate(PEM_read_bio_X509(reader.get(), nullptr, refusePassphrase, nullptr))) {
    certificates.push_back(std::move(certificate));
  }
  const bool reachedEnd = ERR_GET_REASON(ERR_peek_last_error()) == PEM_R_NO_START_LINE;
  ERR_clear_error();
  return reachedEnd ? certificates : std::vector<Certificate>{};
}

Key privateKeyInPEM(std::string_view text) {
  const auto reader = readerOf(text);
  auto key =
      reader ? adoptKey(PEM_read_bio_PrivateKey(reader.get(), nullptr, refusePassphrase, nullptr)) : nullptr;
  ERR_clear_error();
  char curve[32] = {};
  const bool usable =
      key && EVP_PKEY_get_group_name(key.get(), curve, sizeof curve, nullptr) == 1 && curve == kCurve;
  ERR_clear_error();
  return usable ? key : nullptr;
}

}  // namespace kvr
