#pragma once

#include <openssl/evp.h>

#include <memory>
#include <string>
#include <vector>

namespace kvr::bench {

// The work of a download, written by hand: it checks only for failure and logs nothing.

/// Converts an answer from JSON to an XML property list.
std::string propertyListByHand(const std::string& json);
/// Replaces a file atomically and durably.
void replaceByHand(const std::string& path, const std::string& bytes);

/// The device's key and certificate chain, read once from their directory.
struct HeldKey {
  explicit HeldKey(const std::string& directory);

  std::shared_ptr<EVP_PKEY> key;
  std::vector<std::string> chain;  ///< DER
};

/// The signature and the chain as header values, joined.
std::string attestByHand(const HeldKey& key, const std::string& body);

}  // namespace kvr::bench
