#pragma once

#include "local/device/DelayedAnswers.h"
#include "local/device/DeviceRoot.h"
#include "platform/services/AccountStore.h"

#include <map>
#include <mutex>

namespace kvr {

/// The account in "Accounts.plist", and renewals of its credentials as scripted there.
///
/// Requests about any account but the present one have no answer. After a successful renewal, the new tokens
/// replace those of the file, in memory, until the file changes.
class LocalAccountStore : public AccountStore {
 public:
  LocalAccountStore(const DeviceRoot& root, Log& log) : root_(root), answers_(log) {}

  std::optional<CloudAccount> primaryAccount() const override;
  std::optional<AuthenticationAccount> authenticationAccountFor(const CloudAccount& account) const override;
  std::optional<StoreAccount> storeAccountFor(const CloudAccount& account) const override;
  std::optional<std::string> tokenFor(const AuthenticationAccount& account,
                                      std::string_view service) const override;
  /// Result codes: the one in the script, or 0 if it has none; `kNotRenewable` when there is no script or no
  /// such account; `kEnding` when the store ends before the answer is due.
  void renewCredentialsFor(const AuthenticationAccount& account, const RenewalOptions& options,
                           RenewalReply reply) override;

  static constexpr std::int64_t kNotRenewable = 1;
  static constexpr std::int64_t kEnding = 2;

 private:
  using Tokens = std::map<std::string, std::string, std::less<>>;

  Value cloudTree(const CloudAccount& account) const;
  Value authenticationTree(const AuthenticationAccount& account) const;
  void hold(const Value& tokens, const std::optional<FileStamp>& stamp);

  const DeviceRoot& root_;
  mutable std::mutex mutex_;            ///< guards the next two
  Tokens renewed_;                      ///< by service
  std::optional<FileStamp> renewedIn_;  ///< the stamp of the file that `renewed_` belongs to
  DelayedAnswers answers_;              ///< last: its answers use the other members
};

}  // namespace kvr
