#include "local/device/LocalAccountStore.h"

#include <utility>

namespace kvr {
namespace {

constexpr std::string_view kFile = "Accounts.plist";

Error failure(std::int64_t code, std::string message) { return {"accounts", code, std::move(message)}; }

/// Whether two stamps belong to the same contents; `settled` does not count.
bool sameContent(std::optional<FileStamp> left, std::optional<FileStamp> right) {
  if (!left || !right) return false;
  left->settled = right->settled = true;
  return *left == *right;
}

double secondsIn(const Value& value) { return value.isNumber() ? value.asDouble() : 0; }

std::int64_t codeIn(const Value& value) { return value.kind() == Value::Kind::Int ? value.integer() : 0; }

}  // namespace

std::optional<CloudAccount> LocalAccountStore::primaryAccount() const {
  const auto tree = root_.trustedDictionary(kFile);
  const auto& account = tree["primaryAccount"];
  if (!account.isDictionary()) return std::nullopt;
  return CloudAccount{account["altDSID"].stringIfAny()};
}

std::optional<AuthenticationAccount> LocalAccountStore::authenticationAccountFor(
    const CloudAccount& account) const {
  const auto cloud = cloudTree(account);
  const auto& authentication = cloud["authenticationAccount"];
  if (!authentication.isDictionary()) return std::nullopt;
  return AuthenticationAccount{authentication["alternateDSID"].stringIfAny()};
}

std::optional<StoreAccount> LocalAccountStore::storeAccountFor(const CloudAccount& account) const {
  const auto cloud = cloudTree(account);
  const auto& identifier = cloud["storeAccountIdentifier"];
  auto storefront = cloud["storefront"].stringIfAny();
  if (identifier.kind() != Value::Kind::Int && !storefront) return std::nullopt;
  return StoreAccount{codeIn(identifier), std::move(storefront)};
}

std::optional<std::string> LocalAccountStore::tokenFor(const AuthenticationAccount& account,
                                                       std::string_view service) const {
  const auto stamp = root_.stamp(kFile);
  const auto tree = authenticationTree(account);
  if (!tree.isDictionary()) return std::nullopt;
  {
    const std::lock_guard lock(mutex_);
    const auto found = renewed_.find(service);
    if (found != renewed_.end() && sameContent(renewedIn_, stamp)) return found->second;
  }
  return tree["tokens"][service].stringIfAny();
}

void LocalAccountStore::renewCredentialsFor(const AuthenticationAccount& account,
                                            const RenewalOptions& /*options*/, RenewalReply reply) {
  // Take the stamp before reading, so that the tokens are never assigned to contents that were not read.
  const auto stamp = root_.stamp(kFile);
  Value script = authenticationTree(account)["renewal"];
  const auto delay = secondsIn(script["delay"]);
  answers_.after(delay, [this, stamp, script = std::move(script), reply = std::move(reply)](bool ending) {
    if (ending) return reply(kEnding, failure(kEnding, "the agent is ending"));
    if (!script.isDictionary()) {
      return reply(kNotRenewable, failure(kNotRenewable, "there is no renewal service for the account"));
    }
    const auto code = codeIn(script["resultCode"]);
    if (code == 0) hold(script["tokens"], stamp);
    const auto message = script["error"].stringIfAny();
    reply(code, message ? std::optional(failure(code, *message)) : std::nullopt);
  });
}

/// The entry of a cloud account; null when it is no longer the primary one.
Value LocalAccountStore::cloudTree(const CloudAccount& account) const {
  const auto tree = root_.trustedDictionary(kFile);
  const auto& cloud = tree["primaryAccount"];
  return cloud["altDSID"].stringIfAny() == account.altDSID ? cloud : Value();
}

Value LocalAccountStore::authenticationTree(const AuthenticationAccount& account) const {
  const auto tree = root_.trustedDictionary(kFile);
  const auto& authentication = tree["primaryAccount"]["authenticationAccount"];
  return authentication["alternateDSID"].stringIfAny() == account.alternateDSID ? authentication : Value();
}

void LocalAccountStore::hold(const Value& tokens, const std::optional<FileStamp>& stamp) {
  const std::lock_guard lock(mutex_);
  if (!sameContent(renewedIn_, stamp)) renewed_.clear();
  renewedIn_ = stamp;
  if (!tokens.isDictionary()) return;
  for (const auto& [service, token] : tokens.dictionary()) {
    if (token.isString()) renewed_.insert_or_assign(service, token.string());
  }
}

}  // namespace kvr
