#pragma once

#include "local/device/DelayedAnswers.h"
#include "local/device/DeviceRoot.h"
#include "platform/services/AccountStore.h"

#include <map>
#include <mutex>

namespace kvr {

/// The account of "Accounts.plist", and the renewal of its credentials as scripted there.
///
/// What is asked of another account than the present one has no answer. The tokens of a renewal that
/// succeeded are held in memory, in the place of the file's, until the file changes.
class LocalAccountStore : public AccountStore {
 public:
  LocalAccountStore(const DeviceRoot& root, Log& log) : root_(root), answers_(log) {}

  std::optional<CloudAccount> primaryAccount() const override;
  std::optional<AuthenticationAccount> authenticationAccountFor(const CloudAccount& account) const override;
  std::optional<StoreAccount> storeAccountFor(const CloudAccount& account) const override;
  std::optional<std::string> tokenFor(const AuthenticationAccount& account,
                                      std::string_view service) const override;
  /// Result codes: that of the script, which is 0 where it names none; `kNotRenewable` when there is no
  /// script or no such account; `kEnding` when the store ends before the answer is due.
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
  std::optional<FileStamp> renewedIn_;  ///< the file that `renewed_` goes with
  DelayedAnswers answers_;              ///< the last member: its answers use the others
};

}  // namespace kvr
