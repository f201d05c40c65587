#pragma once

#include "local/keys/LocalCertificates.h"
#include "platform/log/Log.h"
#include "platform/services/Clock.h"
#include "platform/services/DeviceAttestation.h"
#include "platform/services/Files.h"

#include <cstdint>
#include <map>
#include <mutex>
#include <optional>
#include <string>
#include <vector>

namespace kvr {

/// A private key of the user and the certificates that attest it.
struct AttestedCredentials {
  AttestedKeyRef key;
  std::string leaf;    ///< DER
  std::string issuer;  ///< DER
};

/// Keys with certificates of a local authority, stored below "Library/Keys/LABEL" of the home directory: the
/// authority as "authority.key" and "authority.pem", and for each kind of certificate KIND.key and KIND.pem
/// (the leaf, then the authority).
///
/// Credentials are issued once and then answered from the files, until they are out of date or no longer
/// describe the device. A missing file is created again; so is one that is damaged or does not match the
/// others, after one error line about it. Verified credentials are cached in memory while their files are
/// unchanged. Any thread; several processes may share the files.
class LocalKeyStore {
 public:
  struct Request {
    std::string label;          ///< becomes a directory name
    std::string kind;           ///< becomes part of file names
    DistinguishedName subject;  ///< how the certificate describes the device
    std::int64_t validity = 0;  ///< minutes, above 0
  };

  LocalKeyStore(Files& files, const Clock& clock, Log& log);

  /// The stored credentials, or newly issued ones. An error when the files can be neither read nor written.
  Result<AttestedCredentials> credentialsFor(const Request& request);

 private:
  /// A key and the certificates in its file: its own, then the issuer's.
  struct KeyPair {
    openssl::Key key;
    std::vector<openssl::Certificate> certificates;
  };
  /// Credentials answered from files, and the stamps of those files.
  struct Held {
    std::vector<FileStamp> stamps;
    AttestedCredentials credentials;
    openssl::Certificate leaf;
    openssl::Certificate authority;
  };
  struct Authority {
    CertifiedKey pair;
    bool isNew;
  };

  std::optional<AttestedCredentials> heldCredentials(const std::string& directory, const Request& request);
  /// The stamps of all files of a key; nothing while one is missing or too recent to be trusted.
  std::optional<std::vector<FileStamp>> stampsOf(const std::string& directory, const std::string& base);
  Result<Authority> authorityIn(const std::string& directory);
  Result<std::optional<CertifiedKey>> keptLeaf(const std::string& base, const Request& request,
                                               const openssl::Certificate& authority);
  Result<CertifiedKey> issueLeaf(const std::string& base, const Request& request,
                                 const CertifiedKey& authority);
  Result<std::optional<KeyPair>> readPair(const std::string& base, std::size_t certificates);
  std::optional<Error> writePair(const std::string& base, const openssl::Key& key,
                                 const std::vector<openssl::Certificate>& certificates);
  Result<std::optional<std::string>> contentOf(const std::string& path);
  void reportDamage(const std::string& path, const char* what);

  Files& files_;
  const Clock& clock_;
  Log& log_;
  std::mutex mutex_;  ///< guards what follows
  std::map<std::string, FileStamp> reported_;
  std::map<std::string, Held> held_;  ///< by the path of the key's files, without suffix
};

}  // namespace kvr
