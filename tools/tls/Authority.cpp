#include "tls/Authority.h"

#include <openssl/x509v3.h>

#include <stdexcept>
#include <utility>

namespace kvr::tls {
namespace {

constexpr long kHour = 3600;
constexpr long kDay = 24 * kHour;

template <class T>
T made(Result<T> result) {
  if (!result) throw std::runtime_error(describe(result.error()));
  return *std::move(result);
}

void require(bool isDone) {
  if (!isDone) throw std::runtime_error(describe(openssl::lastError("cannot make a certificate")));
}

void addExtension(X509* certificate, X509* issuer, int identifier, const char* value) {
  X509V3_CTX context{};
  X509V3_set_ctx(&context, issuer, certificate, nullptr, nullptr, 0);
  const openssl::ExtensionHandle extension(X509V3_EXT_conf_nid(nullptr, &context, identifier, value));
  require(extension && X509_add_ext(certificate, extension.get(), -1) == 1);
}

/// When a certificate begins and ends to be valid, in seconds from now.
std::pair<long, long> validity(Flaw flaw) {
  if (flaw == Flaw::Expired) return {-2 * kDay, -kDay};
  if (flaw == Flaw::Early) return {kDay, 2 * kDay};
  return {-kHour, kDay};
}

}  // namespace

Authority::Authority() : own_{made(newPrivateKey()), nullptr} {
  own_.certificate = made(newAuthorityCertificate(own_.key));
}

std::string Authority::pem() const { return made(pemOf(own_.certificate)); }

CertifiedKey Authority::issue(Flaw flaw) const {
  if (flaw == Flaw::Unknown) return Authority().issue();
  CertifiedKey leaf{made(newPrivateKey()), openssl::adoptCertificate(X509_new())};
  X509* const raw = leaf.certificate.get();
  require(raw != nullptr && X509_set_version(raw, X509_VERSION_3) == 1);
  require(ASN1_INTEGER_set(X509_get_serialNumber(raw), 1) == 1);
  const auto [begin, end] = validity(flaw);
  require(X509_gmtime_adj(X509_getm_notBefore(raw), begin) && X509_gmtime_adj(X509_getm_notAfter(raw), end));
  const auto* const name = reinterpret_cast<const unsigned char*>("coverage");
  require(X509_NAME_add_entry_by_NID(X509_get_subject_name(raw), NID_commonName, MBSTRING_UTF8, name, -1, -1,
                                     0) == 1);
  require(X509_set_pubkey(raw, leaf.key.get()) == 1);

  const bool isOwnIssuer = flaw == Flaw::SelfSigned;
  X509* const issuer = isOwnIssuer ? raw : own_.certificate.get();
  require(X509_set_issuer_name(raw, X509_get_subject_name(issuer)) == 1);
  addExtension(raw, issuer, NID_basic_constraints, "critical,CA:FALSE");
  if (!isOwnIssuer) addExtension(raw, issuer, NID_authority_key_identifier, "keyid:always");
  addExtension(raw, issuer, NID_ext_key_usage, "serverAuth");
  addExtension(raw, issuer, NID_subject_alt_name,
               flaw == Flaw::Elsewhere ? "IP:127.0.0.2,DNS:elsewhere.example"
                                       : "IP:127.0.0.1,DNS:localhost,DNS:coverage.example");
  require(X509_sign(raw, isOwnIssuer ? leaf.key.get() : own_.key.get(), EVP_sha256()) > 0);
  return leaf;
}

}  // namespace kvr::tls
