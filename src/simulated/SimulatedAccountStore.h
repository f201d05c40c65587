#pragma once

#include "platform/services/AccountStore.h"
#include "platform/services/WorkQueues.h"

#include <map>
#include <optional>
#include <string>
#include <vector>

namespace kvr {

/// One user's accounts, set by the test, with scripted renewals.
class SimulatedAccountStore : public AccountStore {
 public:
  struct Renewal {
    std::int64_t resultCode = 0;
    /// Replace the held tokens when the result code is 0.
    std::map<std::string, std::string> tokens{};
    double delay = 0;  ///< seconds
    std::optional<Error> error{};
    bool never = false;
  };

  explicit SimulatedAccountStore(WorkQueues& queues)
      : queues_(queues), queue_(queues.newSerialQueue("account store")) {}

  std::optional<CloudAccount> primary;
  std::optional<AuthenticationAccount> authentication;
  std::optional<StoreAccount> store;
  std::map<std::string, std::string, std::less<>> tokens;  ///< by service
  Renewal renewal;                                         ///< the outcome of every renewal
  std::vector<RenewalOptions> renewals;                    ///< all requested ones, in order

  std::optional<CloudAccount> primaryAccount() const override { return primary; }
  std::optional<AuthenticationAccount> authenticationAccountFor(
      const CloudAccount& /*account*/) const override {
    return authentication;
  }
  std::optional<StoreAccount> storeAccountFor(const CloudAccount& /*account*/) const override {
    return store;
  }
  std::optional<std::string> tokenFor(const AuthenticationAccount& /*account*/,
                                      std::string_view service) const override {
    const auto found = tokens.find(service);
    return found == tokens.end() ? std::nullopt : std::optional(found->second);
  }
  void renewCredentialsFor(const AuthenticationAccount& /*account*/, const RenewalOptions& options,
                           RenewalReply reply) override {
    renewals.push_back(options);
    if (renewal.never) {
      unanswered_.push_back(std::move(reply));
      return;
    }
    queues_.after(renewal.delay, queue_, [this, outcome = renewal, reply = std::move(reply)] {
      if (outcome.resultCode == 0) {
        for (const auto& [service, token] : outcome.tokens) tokens[service] = token;
      }
      reply(outcome.resultCode, outcome.error);
    });
  }

 private:
  WorkQueues& queues_;
  const WorkQueueRef queue_;
  std::vector<RenewalReply> unanswered_;
};

class SimulatedAccountSession : public AccountSession {
 public:
  using Headers = std::map<std::string, std::string>;

  Headers clientInfo;
  Headers deviceIdentifier;
  Headers authentication;

  void addClientInfoHeader(HTTPRequest& request) const override { add(clientInfo, request); }
  void addDeviceIdentifierHeader(HTTPRequest& request) const override { add(deviceIdentifier, request); }
  Headers authenticationHeadersFor(const HTTPRequest& /*request*/) const override { return authentication; }

 private:
  static void add(const Headers& headers, HTTPRequest& request) {
    for (const auto& [name, value] : headers) request.headers.set(name, value);
  }
};

}  // namespace kvr
