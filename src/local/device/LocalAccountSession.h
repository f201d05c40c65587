#pragma once

#include "local/device/DeviceRoot.h"
#include "platform/services/AccountStore.h"

namespace kvr {

/// The session headers of "Accounts.plist".
class LocalAccountSession : public AccountSession {
 public:
  explicit LocalAccountSession(const DeviceRoot& root) : root_(root) {}

  void addClientInfoHeader(HTTPRequest& request) const override;
  void addDeviceIdentifierHeader(HTTPRequest& request) const override;
  std::map<std::string, std::string> authenticationHeadersFor(const HTTPRequest& request) const override;

 private:
  std::map<std::string, std::string> headers(std::string_view kind) const;

  const DeviceRoot& root_;
};

}  // namespace kvr
