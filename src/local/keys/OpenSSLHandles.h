#pragma once

#include "platform/value/Error.h"

#include <openssl/bio.h>
#include <openssl/bn.h>
#include <openssl/err.h>
#include <openssl/evp.h>
#include <openssl/x509.h>
#include <openssl/x509_vfy.h>

#include <memory>
#include <string>

namespace kvr::openssl {

template <auto kFree>
struct Freeing {
  template <class T>
  void operator()(T* handle) const {
    kFree(handle);
  }
};

template <class T, auto kFree>
using Handle = std::unique_ptr<T, Freeing<kFree>>;

using BioHandle = Handle<BIO, BIO_free_all>;
using BignumHandle = Handle<BIGNUM, BN_free>;
using DigestContextHandle = Handle<EVP_MD_CTX, EVP_MD_CTX_free>;
using ExtensionHandle = Handle<X509_EXTENSION, X509_EXTENSION_free>;
using NameHandle = Handle<X509_NAME, X509_NAME_free>;
using StoreHandle = Handle<X509_STORE, X509_STORE_free>;
using StoreContextHandle = Handle<X509_STORE_CTX, X509_STORE_CTX_free>;

// Never changed once created, so that threads may share them.
using Key = std::shared_ptr<EVP_PKEY>;
using Certificate = std::shared_ptr<X509>;

inline Key adoptKey(EVP_PKEY* key) { return {key, Freeing<EVP_PKEY_free>{}}; }
inline Certificate adoptCertificate(X509* certificate) { return {certificate, Freeing<X509_free>{}}; }

/// OpenSSL's description of the latest failure on this thread; also clears OpenSSL's error queue.
inline Error lastError(std::string message) {
  const unsigned long code = ERR_peek_last_error();
  if (const char* reason = code == 0 ? nullptr : ERR_reason_error_string(code))
    message += ": " + std::string(reason);
  ERR_clear_error();
  return {"openssl", ERR_GET_REASON(code), std::move(message)};
}

}  // namespace kvr::openssl
