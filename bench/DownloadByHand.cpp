#include "DownloadByHand.h"

#include <fcntl.h>
#include <nlohmann/json.hpp>
#include <openssl/pem.h>
#include <openssl/x509.h>
#include <unistd.h>
#include <zlib.h>

#include <cstdio>
#include <stdexcept>

namespace kvr::bench {
namespace {

void require(bool succeeded, const char* what) {
  if (!succeeded) throw std::runtime_error(what);
}

void appendText(std::string& xml, const std::string& text) {
  for (const char c : text) {
    if (c == '&') {
      xml += "&amp;";
    } else if (c == '<') {
      xml += "&lt;";
    } else if (c == '>') {
      xml += "&gt;";
    } else {
      xml += c;
    }
  }
}

void append(std::string& xml, const nlohmann::json& tree) {
  if (tree.is_object()) {
    xml += "<dict>";
    for (const auto& [key, value] : tree.items()) {
      xml += "<key>";
      appendText(xml, key);
      xml += "</key>\n";
      append(xml, value);
    }
    xml += "</dict>\n";
  } else if (tree.is_array()) {
    xml += "<array>";
    for (const auto& element : tree) append(xml, element);
    xml += "</array>\n";
  } else if (tree.is_string()) {
    xml += "<string>";
    appendText(xml, tree.get_ref<const std::string&>());
    xml += "</string>\n";
  } else if (tree.is_boolean()) {
    xml += tree.get<bool>() ? "<true/>\n" : "<false/>\n";
  } else {
    xml.append("<integer>").append(std::to_string(tree.get<long long>())).append("</integer>\n");
  }
}

std::string base64(const unsigned char* bytes, std::size_t size) {
  std::string text((size + 2) / 3 * 4 + 1, '\0');
  const int length =
      EVP_EncodeBlock(reinterpret_cast<unsigned char*>(text.data()), bytes, static_cast<int>(size));
  text.resize(static_cast<std::size_t>(length));
  return text;
}

std::string base64(const std::string& bytes) {
  return base64(reinterpret_cast<const unsigned char*>(bytes.data()), bytes.size());
}

std::string deflated(const std::string& data) {
  z_stream stream{};
  require(deflateInit2(&stream, Z_DEFAULT_COMPRESSION, Z_DEFLATED, -15, 8, Z_DEFAULT_STRATEGY) == Z_OK,
          "deflateInit2");
  std::string compressed(data.size(), '\0');
  stream.next_in = reinterpret_cast<Bytef*>(const_cast<char*>(data.data()));
  stream.avail_in = static_cast<uInt>(data.size());
  stream.next_out = reinterpret_cast<Bytef*>(compressed.data());
  stream.avail_out = static_cast<uInt>(compressed.size());
  require(deflate(&stream, Z_FINISH) == Z_STREAM_END, "deflate");
  compressed.resize(stream.total_out);
  deflateEnd(&stream);
  return compressed;
}

}  // namespace

std::string propertyListByHand(const std::string& json) {
  std::string xml = "<?xml version=\"1.0\" encoding=\"UTF-8\"?>\n<plist version=\"1.0\">\n";
  append(xml, nlohmann::json::parse(json));
  return xml += "</plist>\n";
}

void replaceByHand(const std::string& path, const std::string& bytes) {
  const std::string temporary = path + ".new";
  const int file = ::open(temporary.c_str(), O_WRONLY | O_CREAT | O_TRUNC | O_CLOEXEC, 0600);
  require(file >= 0, "open");
  require(::write(file, bytes.data(), bytes.size()) == static_cast<ssize_t>(bytes.size()), "write");
  require(::fsync(file) == 0, "fsync");
  ::close(file);
  require(::rename(temporary.c_str(), path.c_str()) == 0, "rename");
  const int directory = ::open(path.substr(0, path.rfind('/')).c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC);
  require(directory >= 0 && ::fsync(directory) == 0, "fsync of the directory");
  ::close(directory);
}

HeldKey::HeldKey(const std::string& directory) {
  using File = std::unique_ptr<std::FILE, int (*)(std::FILE*)>;
  const File keyFile(std::fopen((directory + "/preferred.key").c_str(), "r"), std::fclose);
  const File chainFile(std::fopen((directory + "/preferred.pem").c_str(), "r"), std::fclose);
  require(keyFile && chainFile, "there is no held key");
  key.reset(PEM_read_PrivateKey(keyFile.get(), nullptr, nullptr, nullptr), EVP_PKEY_free);
  require(key != nullptr, "the held key cannot be read");
  while (X509* certificate = PEM_read_X509(chainFile.get(), nullptr, nullptr, nullptr)) {
    std::string bytes(static_cast<std::size_t>(i2d_X509(certificate, nullptr)), '\0');
    auto* out = reinterpret_cast<unsigned char*>(bytes.data());
    i2d_X509(certificate, &out);
    chain.push_back(std::move(bytes));
    X509_free(certificate);
  }
}

std::string attestByHand(const HeldKey& key, const std::string& body) {
  const std::unique_ptr<EVP_MD_CTX, void (*)(EVP_MD_CTX*)> context(EVP_MD_CTX_new(), EVP_MD_CTX_free);
  unsigned char signature[256];
  std::size_t size = sizeof signature;
  require(EVP_DigestSignInit(context.get(), nullptr, EVP_sha256(), nullptr, key.key.get()) == 1 &&
              EVP_DigestSign(context.get(), signature, &size,
                             reinterpret_cast<const unsigned char*>(body.data()), body.size()) == 1,
          "the body cannot be signed");
  std::string json = R"({"certs":[)";
  for (const auto& certificate : key.chain) json.append("\"").append(base64(certificate)).append("\",");
  json.back() = ']';
  json += '}';
  return base64(signature, size) + base64(deflated(json));
}

}  // namespace kvr::bench
