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

// Keys and X.509 certificates as the local authority makes them: P-256 keys, certificates signed by ECDSA
// with SHA-256. Errors are in domain "openssl". Any thread.

/// A key pair with its certificate.
struct CertifiedKey {
  openssl::Key key;
  openssl::Certificate certificate;
};

/// The parts of a distinguished name by OpenSSL's numbers for them, in order. A text that cannot stand in a
/// certificate (empty, too long for its part, not UTF-8) is left out.
using DistinguishedName = std::vector<std::pair<int, std::string>>;

Result<openssl::Key> newPrivateKey();

/// A self-signed authority. It is valid at all times, so that a clock gone astray never ends it: it is
/// trusted for the place where it lies.
Result<openssl::Certificate> newAuthorityCertificate(const openssl::Key& key);

/// A leaf that may sign, issued by `authority`. It is valid for `validity` minutes from `now`, and for a few
/// minutes before, so that a clock set back a little does not void it.
Result<openssl::Certificate> newLeafCertificate(const openssl::Key& key, const DistinguishedName& subject,
                                                const CertifiedKey& authority, Date now,
                                                std::int64_t validity);

bool hasSubject(const openssl::Certificate& certificate, const DistinguishedName& subject);
bool isSameCertificate(const openssl::Certificate& left, const openssl::Certificate& right);
bool belongTogether(const CertifiedKey& pair);

enum class Verdict { Good, OutOfDate, Bad };
/// Whether `authority` (trusted) issued `certificate` for signing, as of `now`.
Verdict verify(const openssl::Certificate& certificate, const openssl::Certificate& authority, Date now);

/// Whether a certificate that was verified once is within its dates as of `now`.
bool isInDate(const openssl::Certificate& certificate, Date now);

/// The signature of a message: ECDSA with SHA-256, in DER form.
Result<std::string> sign(const openssl::Key& key, std::string_view message);

Result<std::string> derOf(const openssl::Certificate& certificate);
Result<std::string> pemOf(const openssl::Certificate& certificate);
/// Unencrypted PKCS #8.
Result<std::string> pemOf(const openssl::Key& key);
/// All certificates of a PEM text; none when any of them is damaged.
std::vector<openssl::Certificate> certificatesInPEM(std::string_view text);
/// The P-256 private key of a PEM text; null when there is none.
openssl::Key privateKeyInPEM(std::string_view text);

}  // namespace kvr
