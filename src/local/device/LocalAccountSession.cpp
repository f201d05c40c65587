#include "local/device/LocalAccountSession.h"

namespace kvr {

void LocalAccountSession::addClientInfoHeader(HTTPRequest& request) const {
  for (const auto& [name, value] : headers("clientInfo")) request.headers.set(name, value);
}

void LocalAccountSession::addDeviceIdentifierHeader(HTTPRequest& request) const {
  for (const auto& [name, value] : headers("deviceIdentifier")) request.headers.set(name, value);
}

std::map<std::string, std::string> LocalAccountSession::authenticationHeadersFor(
    const HTTPRequest& /*request*/) const {
  return headers("authentication");
}

std::map<std::string, std::string> LocalAccountSession::headers(std::string_view kind) const {
  std::map<std::string, std::string> fields;
  const auto tree = root_.trustedDictionary("Accounts.plist");
  const auto& list = tree["sessionHeaders"][kind];
  if (!list.isDictionary()) return fields;
  for (const auto& [name, value] : list.dictionary()) {
    if (value.isString()) fields.emplace(name, value.string());
  }
  return fields;
}

}  // namespace kvr
