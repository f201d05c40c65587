#pragma once

#include "platform/services/HTTP.h"
#include "platform/value/Error.h"

#include <cstdint>
#include <functional>
#include <map>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

namespace kvr {

struct CloudAccount {
  std::optional<std::string> altDSID;
};

struct AuthenticationAccount {
  std::optional<std::string> alternateDSID;
};

struct StoreAccount {
  std::int64_t identifier = 0;
  std::optional<std::string> storefront;
};

struct RenewalOptions {
  bool avoidUI = true;
  std::vector<std::string> services;
};

/// The user's accounts and their credentials, read afresh by each call. Any thread.
class AccountStore {
 public:
  /// A result code of 0 means renewed.
  using RenewalReply = std::function<void(std::int64_t resultCode, std::optional<Error> error)>;

  virtual ~AccountStore() = default;
  virtual std::optional<CloudAccount> primaryAccount() const = 0;
  virtual std::optional<AuthenticationAccount> authenticationAccountFor(
      const CloudAccount& account) const = 0;
  virtual std::optional<StoreAccount> storeAccountFor(const CloudAccount& account) const = 0;
  /// The token of the credential held for a service, or nothing.
  virtual std::optional<std::string> tokenFor(const AuthenticationAccount& account,
                                              std::string_view service) const = 0;
  /// Renews credentials. `reply` is called exactly once, on a thread of the store's own, possibly very late.
  virtual void renewCredentialsFor(const AuthenticationAccount& account, const RenewalOptions& options,
                                   RenewalReply reply) = 0;
};

/// The headers with which the platform's account service identifies client and device. Any thread.
class AccountSession {
 public:
  virtual ~AccountSession() = default;
  virtual void addClientInfoHeader(HTTPRequest& request) const = 0;
  virtual void addDeviceIdentifierHeader(HTTPRequest& request) const = 0;
  /// The account-authentication headers for a request.
  virtual std::map<std::string, std::string> authenticationHeadersFor(const HTTPRequest& request) const = 0;
};

}  // namespace kvr
