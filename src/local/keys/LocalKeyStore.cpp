#include "local/keys/LocalKeyStore.h"

#include "platform/names/Names.h"
#include "platform/text/FileName.h"

#include <cerrno>
#include <utility>

namespace kvr {

using namespace openssl;

namespace {

constexpr std::size_t kLargestFile = 64UL << 10U;

class LocalAttestedKey : public AttestedKey {
 public:
  explicit LocalAttestedKey(Key key) : key_(std::move(key)) {}
  Result<std::string> sign(std::string_view message) const override { return kvr::sign(key_, message); }

 private:
  const Key key_;
};

std::string keyPath(const std::string& base) { return base + ".key"; }
std::string certificatePath(const std::string& base) { return base + ".pem"; }

}  // namespace

LocalKeyStore::LocalKeyStore(Files& files, const Clock& clock, Log& log)
    : files_(files), clock_(clock), log_(log) {}

Result<AttestedCredentials> LocalKeyStore::credentialsFor(const Request& request) {
  if (!canNameFile(request.label) || !canNameFile(request.kind) || request.validity <= 0) {
    return Error{"keys", EINVAL, "label, kind or validity is out of bounds"};
  }
  const auto directory = files_.homeDirectory() + "/" + std::string(names::kKeysFolder) + "/" + request.label;
  if (auto held = heldCredentials(directory, request)) return *std::move(held);
  if (auto error = files_.createDirectory(directory)) return *error;
  const auto lock = files_.lock(directory);

  const auto base = directory + "/" + request.kind;
  auto stamps = stampsOf(directory, base);
  const auto authority = authorityIn(directory);
  if (!authority) return authority.error();
  std::optional<CertifiedKey> leaf;
  if (!authority->isNew) {
    const auto kept = keptLeaf(base, request, authority->pair.certificate);
    if (!kept) return kept.error();
    leaf = *kept;
  }
  if (!leaf) {
    stamps.reset();
    const auto issued = issueLeaf(base, request, authority->pair);
    if (!issued) return issued.error();
    leaf = *issued;
  }

  const auto leafBytes = derOf(leaf->certificate);
  if (!leafBytes) return leafBytes.error();
  const auto issuerBytes = derOf(authority->pair.certificate);
  if (!issuerBytes) return issuerBytes.error();
  AttestedCredentials credentials{std::make_shared<LocalAttestedKey>(leaf->key), *leafBytes, *issuerBytes};
  const std::lock_guard own(mutex_);
  held_.erase(base);
  if (stamps) {
    held_.emplace(base,
                  Held{*std::move(stamps), credentials, leaf->certificate, authority->pair.certificate});
  }
  return credentials;
}

std::optional<AttestedCredentials> LocalKeyStore::heldCredentials(const std::string& directory,
                                                                  const Request& request) {
  const auto base = directory + "/" + request.kind;
  const auto stamps = stampsOf(directory, base);
  const auto now = clock_.now();
  const std::lock_guard own(mutex_);
  const auto found = held_.find(base);
  if (found == held_.end() || stamps != found->second.stamps) return std::nullopt;
  const auto& [ignored, credentials, leaf, authority] = found->second;
  if (!isInDate(leaf, now) || !isInDate(authority, now) || !hasSubject(leaf, request.subject)) {
    return std::nullopt;
  }
  return credentials;
}

std::optional<std::vector<FileStamp>> LocalKeyStore::stampsOf(const std::string& directory,
                                                              const std::string& base) {
  std::vector<FileStamp> stamps;
  for (const auto& pair : {directory + "/authority", base}) {
    for (const auto& path : {keyPath(pair), certificatePath(pair)}) {
      const auto stamp = files_.stamp(path);
      if (!stamp || !*stamp || !(*stamp)->settled) return std::nullopt;
      stamps.push_back(**stamp);
    }
  }
  return stamps;
}

Result<LocalKeyStore::Authority> LocalKeyStore::authorityIn(const std::string& directory) {
  const auto base = directory + "/authority";
  const auto kept = readPair(base, 1);
  if (!kept) return kept.error();
  if (*kept) {
    const auto& certificate = (*kept)->certificates.front();
    if (verify(certificate, certificate, clock_.now()) == Verdict::Good) {
      return Authority{{(*kept)->key, certificate}, false};
    }
    reportDamage(certificatePath(base), "it is no authority's certificate");
  }

  const auto key = newPrivateKey();
  if (!key) return key.error();
  const auto certificate = newAuthorityCertificate(*key);
  if (!certificate) return certificate.error();
  if (auto error = writePair(base, *key, {*certificate})) return *error;
  return Authority{{*key, *certificate}, true};
}

Result<std::optional<CertifiedKey>> LocalKeyStore::keptLeaf(const std::string& base, const Request& request,
                                                            const Certificate& authority) {
  const auto kept = readPair(base, 2);
  if (!kept) return kept.error();
  if (!*kept) return std::optional<CertifiedKey>();
  const auto& leaf = (*kept)->certificates.front();
  const auto verdict = verify(leaf, authority, clock_.now());
  if (verdict == Verdict::Bad || !isSameCertificate((*kept)->certificates.back(), authority)) {
    reportDamage(certificatePath(base), "the local authority did not issue it");
    return std::optional<CertifiedKey>();
  }
  if (verdict == Verdict::OutOfDate || !hasSubject(leaf, request.subject))
    return std::optional<CertifiedKey>();
  return std::optional(CertifiedKey{(*kept)->key, leaf});
}

Result<CertifiedKey> LocalKeyStore::issueLeaf(const std::string& base, const Request& request,
                                              const CertifiedKey& authority) {
  const auto key = newPrivateKey();
  if (!key) return key.error();
  const auto leaf = newLeafCertificate(*key, request.subject, authority, clock_.now(), request.validity);
  if (!leaf) return leaf.error();
  if (auto error = writePair(base, *key, {*leaf, authority.certificate})) return *error;
  return CertifiedKey{*key, *leaf};
}

/// The pair in the files; nothing when one is missing or damaged.
Result<std::optional<LocalKeyStore::KeyPair>> LocalKeyStore::readPair(const std::string& base,
                                                                      std::size_t certificates) {
  const auto keyText = contentOf(keyPath(base));
  if (!keyText) return keyText.error();
  const auto certificateText = contentOf(certificatePath(base));
  if (!certificateText) return certificateText.error();
  if (!*keyText || !*certificateText) return std::optional<KeyPair>();

  KeyPair pair{privateKeyInPEM(**keyText), certificatesInPEM(**certificateText)};
  if (!pair.key) {
    reportDamage(keyPath(base), "it holds no private key");
  } else if (pair.certificates.size() != certificates) {
    reportDamage(certificatePath(base), "it does not hold the certificates it should");
  } else if (!belongTogether({pair.key, pair.certificates.front()})) {
    reportDamage(certificatePath(base), "it belongs to another key");
  } else {
    return std::optional(std::move(pair));
  }
  return std::optional<KeyPair>();
}

std::optional<Error> LocalKeyStore::writePair(const std::string& base, const Key& key,
                                              const std::vector<Certificate>& certificates) {
  const auto keyText = pemOf(key);
  if (!keyText) return keyText.error();
  std::string chain;
  for (const auto& certificate : certificates) {
    const auto text = pemOf(certificate);
    if (!text) return text.error();
    chain += *text;
  }
  if (auto error = files_.replace(keyPath(base), *keyText)) return error;
  return files_.replace(certificatePath(base), chain);
}

/// The content of a file; nothing when it is missing or larger than any key or chain could be.
Result<std::optional<std::string>> LocalKeyStore::contentOf(const std::string& path) {
  const auto contents = files_.read(path, kLargestFile);
  if (!contents) {
    if (contents.error().code != EFBIG) return contents.error();
    reportDamage(path, "it is too large");
    return std::optional<std::string>();
  }
  return *contents ? std::optional((**contents).bytes) : std::nullopt;
}

void LocalKeyStore::reportDamage(const std::string& path, const char* what) {
  const auto found = files_.stamp(path);
  const auto stamp = found ? *found : std::nullopt;
  {
    const std::lock_guard lock(mutex_);
    auto& reported = reported_[path];
    if (stamp && reported == *stamp) return;
    reported = stamp.value_or(FileStamp{});
  }
  log_.error("'%s' is damaged: %s; it is made anew", path, what);
}

}  // namespace kvr
