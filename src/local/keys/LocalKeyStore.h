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

/// A private key of the user and what attests it.
struct AttestedCredentials {
  AttestedKeyRef key;
  std::string leaf;    ///< DER
  std::string issuer;  ///< DER
};

/// Keys with certificates of a local authority, kept below "Library/Keys/LABEL" of the home directory:
/// the authority as "authority.key" and "authority.pem", and for each kind of certificate KIND.key and
/// KIND.pem (the leaf, then the authority).
///
/// What is asked for is issued once and answered from there until it is out of date or the device is no
/// longer what it attests. A file that is missing is made anew; so is one that is damaged or does not match
/// the others, after it was reported once at error level. What was read and verified is held, and answered
/// without reading it again, for as long as none of its files has changed. Any thread, and any number of
/// processes.
class LocalKeyStore {
 public:
  struct Request {
    std::string label;          ///< becomes a directory's name
    std::string kind;           ///< becomes files' names
    DistinguishedName subject;  ///< what the certificate says of the device
    std::int64_t validity = 0;  ///< minutes, above 0
  };

  LocalKeyStore(Files& files, const Clock& clock, Log& log);

  /// What is kept or newly issued. An error when the files can be neither read nor written.
  Result<AttestedCredentials> credentialsFor(const Request& request);

 private:
  /// A key and the certificates of its file: its own, then that of who issued it.
  struct KeyPair {
    openssl::Key key;
    std::vector<openssl::Certificate> certificates;
  };
  /// What was answered from files, and the stamps they had.
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
  /// The stamps of all files that belong to a key; nothing while one is missing or too young.
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
  std::map<std::string, Held> held_;  ///< by the path of the key's files
};

}  // namespace kvr
