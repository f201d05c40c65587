#include "RequestRecords.h"

#include "platform/codec/JSON.h"
#include "platform/text/Base64.h"
#include "platform/text/UTF8.h"

#include <algorithm>
#include <charconv>
#include <chrono>
#include <cinttypes>
#include <cstdio>
#include <filesystem>
#include <fstream>
#include <stdexcept>

namespace kvr::coverage_service {
namespace {

/// The text itself, or, if it is not UTF-8, its bytes read as Latin-1.
std::string legible(const std::string& bytes) {
  if (isUTF8(bytes)) return bytes;
  std::string text;
  for (const char byte : bytes) appendUTF8(text, static_cast<unsigned char>(byte));
  return text;
}

Value documentOf(const ReceivedRequest& request, int status, const std::optional<std::string>& reason) {
  const auto now = std::chrono::system_clock::now().time_since_epoch();
  Value::Array headers;
  for (const auto& [name, value] : request.headers) {
    headers.emplace_back(Value::Array{legible(name), legible(value)});
  }
  Value::Dictionary document{{"time", std::chrono::duration<double>(now).count()},
                             {"method", legible(request.method)},
                             {"version", legible(request.version)},
                             {"path", legible(request.target)},
                             {"headers", std::move(headers)},
                             {"status", status}};
  if (!request.tls.empty()) document.emplace("tls", request.tls);
  if (isUTF8(request.body)) {
    document.emplace("body", request.body);
  } else {
    document.emplace("bodyBase64", base64Encode(request.body));
  }
  if (reason) document.emplace("reason", legible(*reason));
  return document;
}

}  // namespace

RequestRecords::RequestRecords(std::string directory) : directory_(std::move(directory)) {
  std::filesystem::create_directories(directory_);
  for (const auto& entry : std::filesystem::directory_iterator(directory_)) {
    const std::string name = entry.path().filename();
    std::int64_t number = 0;
    const auto [end, error] = std::from_chars(name.data(), name.data() + name.size(), number);
    if (error == std::errc() && std::string_view(end) == ".json") count_ = std::max(count_, number);
  }
}

void RequestRecords::add(const ReceivedRequest& request, int status,
                         const std::optional<std::string>& reason) {
  const auto text = writeJSON(documentOf(request, status, reason));
  if (!text) throw std::runtime_error(text.error().message);
  const std::lock_guard lock(mutex_);
  char name[32];
  std::snprintf(name, sizeof name, "%06" PRId64, count_ + 1);
  const std::string temporary = directory_ + "/." + name + ".new";
  std::ofstream out(temporary, std::ios::binary | std::ios::trunc);
  out << *text;
  out.close();
  if (!out) throw std::runtime_error("cannot write " + temporary);
  std::filesystem::rename(temporary, directory_ + "/" + name + ".json");
  ++count_;
}

std::int64_t RequestRecords::count() const {
  const std::lock_guard lock(mutex_);
  return count_;
}

}  // namespace kvr::coverage_service
