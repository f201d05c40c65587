#include "AttestationCheck.h"

#include "local/keys/OpenSSLHandles.h"
#include "platform/codec/JSON.h"
#include "platform/text/Base64.h"

#include <openssl/pem.h>
#include <zlib.h>

#include <array>
#include <climits>
#include <cstdint>
#include <span>
#include <utility>
#include <vector>

namespace kvr::coverage_service {
namespace {

using openssl::Certificate;

using Bytes = std::vector<std::uint8_t>;
using Fault = std::optional<std::string>;

constexpr std::size_t kMaximumInflated = std::size_t{256} << 10;

/// Decodes base64; nothing unless the text is exactly the encoding, without blanks or line breaks.
std::optional<Bytes> strictlyDecoded(const std::string& text) {
  auto bytes = base64Decode(text);
  if (bytes && (bytes->empty() || base64Encode(*bytes) != text)) return std::nullopt;
  return bytes;
}

/// The content of a raw DEFLATE stream; nothing when it is invalid, incomplete or followed by other bytes.
std::optional<std::string> inflated(Bytes& bytes) {
  z_stream stream{};
  if (inflateInit2(&stream, -MAX_WBITS) != Z_OK) return std::nullopt;
  std::string text(kMaximumInflated, '\0');
  stream.next_in = bytes.data();
  stream.avail_in = static_cast<uInt>(bytes.size());
  stream.next_out = reinterpret_cast<Bytef*>(text.data());
  stream.avail_out = static_cast<uInt>(text.size());
  const int result = inflate(&stream, Z_FINISH);
  const bool isWhole = result == Z_STREAM_END && stream.avail_in == 0;
  text.resize(text.size() - stream.avail_out);
  inflateEnd(&stream);
  if (!isWhole) return std::nullopt;
  return text;
}

Certificate certificateFrom(std::span<const std::uint8_t> der) {
  const unsigned char* next = der.data();
  auto certificate = openssl::adoptCertificate(d2i_X509(nullptr, &next, static_cast<long>(der.size())));
  ERR_clear_error();
  return certificate && next == der.data() + der.size() ? certificate : nullptr;
}

/// Decodes the chain's header, layer by layer.
Fault readChain(const std::string& header, std::vector<Certificate>& chain) {
  auto compressed = strictlyDecoded(header);
  if (!compressed) return "the chain is not base64";
  const auto text = inflated(*compressed);
  if (!text) return "the chain is not one raw DEFLATE stream";
  if (compressed->size() > text->size()) return "the chain has not become smaller by compression";
  const auto document = readJSON(*text);
  if (!document) return "the chain is not JSON: " + document.error().message;
  if (!document->isDictionary() || document->dictionary().size() != 1 || !(*document)["certs"].isArray()) {
    return "the chain is not an object with the one member \"certs\"";
  }
  const auto rewritten = writeJSON(*document, JSONSlashes::Escaped);
  if (!rewritten || *rewritten != *text) return "the chain's JSON is not compact with each \"/\" escaped";
  for (const Value& element : (*document)["certs"].array()) {
    const auto der = strictlyDecoded(element.stringIfAny().value_or(""));
    auto certificate = der ? certificateFrom(*der) : nullptr;
    if (!certificate) return "the chain holds what is not a certificate";
    chain.push_back(std::move(certificate));
  }
  if (chain.empty()) return "the chain is empty";
  return std::nullopt;
}

Fault faultOfSignature(const std::string& header, const std::string& body, const Certificate& leaf) {
  const auto signature = strictlyDecoded(header);
  if (!signature) return "the signature is not base64";
  EVP_PKEY* const key = X509_get0_pubkey(leaf.get());
  if (key == nullptr || EVP_PKEY_get_base_id(key) != EVP_PKEY_EC)
    return "the leaf's key is not one for ECDSA";
  const openssl::DigestContextHandle context(EVP_MD_CTX_new());
  const bool isGood = context &&
                      EVP_DigestVerifyInit(context.get(), nullptr, EVP_sha256(), nullptr, key) == 1 &&
                      EVP_DigestVerify(context.get(), signature->data(), signature->size(),
                                       reinterpret_cast<const unsigned char*>(body.data()), body.size()) == 1;
  ERR_clear_error();
  if (!isGood) return "the signature is not the leaf's over the body";
  return std::nullopt;
}

std::vector<Certificate> authoritiesIn(const std::string& content) {
  std::vector<Certificate> found;
  const std::span<const std::uint8_t> bytes(reinterpret_cast<const std::uint8_t*>(content.data()),
                                            content.size());
  if (auto single = certificateFrom(bytes)) return {std::move(single)};
  if (content.size() > INT_MAX) return {};
  const openssl::BioHandle reader(BIO_new_mem_buf(content.data(), static_cast<int>(content.size())));
  while (X509* const next = reader ? PEM_read_bio_X509(reader.get(), nullptr, nullptr, nullptr) : nullptr) {
    found.push_back(openssl::adoptCertificate(next));
  }
  ERR_clear_error();
  return found;
}

Fault faultOfTrust(const std::vector<Certificate>& chain, const std::string& authority) {
  const openssl::StoreHandle trusted(X509_STORE_new());
  const openssl::StoreContextHandle context(X509_STORE_CTX_new());
  const openssl::Handle<STACK_OF(X509), [](STACK_OF(X509) * stack) { sk_X509_free(stack); }> others(
      sk_X509_new_null());
  bool isReady = trusted && context && others;
  const auto authorities = authoritiesIn(authority);
  if (authorities.empty()) return "the authority's file holds no certificate";
  for (const auto& certificate : authorities) {
    isReady = isReady && X509_STORE_add_cert(trusted.get(), certificate.get()) == 1;
  }
  for (std::size_t at = 1; at < chain.size(); ++at) {
    isReady = isReady && sk_X509_push(others.get(), chain[at].get()) > 0;
  }
  isReady =
      isReady && X509_STORE_CTX_init(context.get(), trusted.get(), chain.front().get(), others.get()) == 1;
  if (!isReady) return "the chain cannot be verified";
  X509_VERIFY_PARAM_set_flags(X509_STORE_CTX_get0_param(context.get()), X509_V_FLAG_PARTIAL_CHAIN);
  const bool isGood = X509_verify_cert(context.get()) == 1;
  ERR_clear_error();
  if (isGood) return std::nullopt;
  const int reason = X509_STORE_CTX_get_error(context.get());
  return std::string("the chain does not lead to the authority: ") + X509_verify_cert_error_string(reason);
}

}  // namespace

std::optional<std::string> faultOf(const Attestation& attestation,
                                   const std::optional<std::string>& authority) {
  std::vector<Certificate> chain;
  if (auto fault = readChain(attestation.chain, chain)) return fault;
  if (auto fault = faultOfSignature(attestation.signature, attestation.body, chain.front())) return fault;
  return authority ? faultOfTrust(chain, *authority) : std::nullopt;
}

}  // namespace kvr::coverage_service
