#pragma once

#include "local/keys/OpenSSLHandles.h"
#include "platform/value/Date.h"

#include <cstdint>
#include <optional>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

namespace kvr {

// Keys and X.509 certificates of the local authority: P-256 keys, certificates signed with ECDSA and SHA-256.
// Errors are in domain "openssl". Any thread.

/// A key pair with its certificate.
struct CertifiedKey {
  openssl::Key key;
  openssl::Certificate certificate;
};

/// The attributes of a distinguished name, keyed by OpenSSL's NIDs, in order. A text that is not allowed in a
/// certificate (empty, too long for its attribute, not UTF-8) is left out.
using DistinguishedName = std::vector<std::pair<int, std::string>>;

Result<openssl::Key> newPrivateKey();

/// A self-signed authority. It never expires, so that a wrong clock cannot invalidate it; it is trusted
/// because of the directory it is stored in.
Result<openssl::Certificate> newAuthorityCertificate(const openssl::Key& key);

/// A leaf certificate for signing, issued by `authority`. Valid for `validity` minutes from `now`, and from a
/// few minutes before `now`, so that it survives a clock set back a little.
Result<openssl::Certificate> newLeafCertificate(const openssl::Key& key, const DistinguishedName& subject,
                                                const CertifiedKey& authority, Date now,
                                                std::int64_t validity);

bool hasSubject(const openssl::Certificate& certificate, const DistinguishedName& subject);
bool isSameCertificate(const openssl::Certificate& left, const openssl::Certificate& right);
bool belongTogether(const CertifiedKey& pair);

enum class Verdict { Good, OutOfDate, Bad };
/// Checks that the trusted `authority` issued `certificate` for signing, as of `now`.
Verdict verify(const openssl::Certificate& certificate, const openssl::Certificate& authority, Date now);

/// Whether an already verified certificate is within its validity dates at `now`.
bool isInDate(const openssl::Certificate& certificate, Date now);

/// The signature of a message: ECDSA with SHA-256, in DER form.
Result<std::string> sign(const openssl::Key& key, std::string_view message);

Result<std::string> derOf(const openssl::Certificate& certificate);
Result<std::string> pemOf(const openssl::Certificate& certificate);
/// Unencrypted PKCS #8.
Result<std::string> pemOf(const openssl::Key& key);
/// All certificates in a PEM text; none if any of them is damaged.
std::vector<openssl::Certificate> certificatesInPEM(std::string_view text);
/// The P-256 private key in a PEM text; null when there is none.
openssl::Key privateKeyInPEM(std::string_view text);

}  // namespace kvr
