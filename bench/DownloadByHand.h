#pragma once

#include <openssl/evp.h>

#include <memory>
#include <string>
#include <vector>

namespace kvr::bench {

// The same work as a download's, by hand: no checks but for failure, nothing logged.

/// The JSON of an answer as an XML property list.
std::string propertyListByHand(const std::string& json);
/// Puts a file in another's place, atomically and durably.
void replaceByHand(const std::string& path, const std::string& bytes);

/// The device's key and its certificate chain, read once from the directory they are kept in.
struct HeldKey {
  explicit HeldKey(const std::string& directory);

  std::shared_ptr<EVP_PKEY> key;
  std::vector<std::string> chain;  ///< DER
};

/// Signature and chain as header values, joined.
std::string attestByHand(const HeldKey& key, const std::string& body);

}  // namespace kvr::bench
