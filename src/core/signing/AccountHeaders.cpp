#include "core/signing/AccountHeaders.h"

#include "core/signing/SigningKeys.h"
#include "platform/codec/JSON.h"
#include "platform/text/UTF8.h"

#include <cmath>
#include <cstdint>
#include <mutex>

namespace kvr {
namespace {

constexpr const char* kTokenService = "com.tarsil.vornic.supportapp.auth";
constexpr double kRenewalLimit = 60;  // seconds

std::uint64_t millisecondsSince1970(Date date) {
  const double milliseconds = date.secondsSince1970 * 1000.0;
  return milliseconds > 0 && milliseconds < 18446744073709551616.0 ? static_cast<std::uint64_t>(milliseconds)
                                                                   : 0;
}

/// The result of a renewal, shared with its completion: the answer may come after the wait has timed out.
struct Renewal {
  explicit Renewal(std::shared_ptr<Signal> signal) : answered(std::move(signal)) {}

  std::mutex mutex;
  std::optional<std::string> token;
  const std::shared_ptr<Signal> answered;
};

void reportFailedRenewal(Log& log, std::int64_t resultCode, const std::optional<Error>& error) {
  log.error("No way to sign request with Vornic token because renewal of Vornic credential failed: %ld, %@",
            resultCode, error);
}

/// Renews the account's credentials and returns the token: the new one (possibly none), or `held` if the
/// renewal fails.
std::optional<std::string> renewedToken(Platform& platform, AccountStore& store,
                                        const AuthenticationAccount& account,
                                        const std::optional<std::string>& held, bool avoidUI) {
  auto& log = platform.log;
  log.standard("Reprovision Vornic tokens");
  const auto renewal = std::make_shared<Renewal>(platform.queues.newSignal());
  renewal->token = held;
  store.renewCredentialsFor(
      account, {avoidUI, {kTokenService}},
      [&log, &store, account, renewal](std::int64_t resultCode, const std::optional<Error>& error) {
        if (resultCode != 0) {
          reportFailedRenewal(log, resultCode, error);
        } else {
          auto token = store.tokenFor(account, kTokenService);
          const std::lock_guard lock(renewal->mutex);
          renewal->token = std::move(token);
        }
        renewal->answered->signal();
      });
  if (!renewal->answered->wait(kRenewalLimit)) {
    reportFailedRenewal(log, -1, Error{"accounts", -1, format("no answer within %d seconds", 60)});
    return held;
  }
  const std::lock_guard lock(renewal->mutex);
  return renewal->token;
}

/// The value of an optional header; nothing, with a log line, if it cannot be sent: an invalid header would
/// fail the whole request.
std::optional<std::string> sendable(Log& log, std::string_view name,
                                    const std::optional<std::string>& value) {
  const auto objection = value ? HTTPHeaders::objectionTo(name, *value) : std::nullopt;
  if (!objection) return value;
  log.error("header '%s' is left out, it cannot be sent: %s", name, *objection);
  return std::nullopt;
}

void addSessionHeaders(Platform& platform, HTTPRequest& request) {
  const auto add = [&](const std::string& name, const std::string& value) {
    if (const auto sent = sendable(platform.log, name, value)) request.headers.set(name, sent);
  };
  // One after the other: a header that cannot be sent must not take the place of one that can.
  for (const auto addHeader :
       {&AccountSession::addClientInfoHeader, &AccountSession::addDeviceIdentifierHeader}) {
    HTTPRequest withHeader = request;
    (platform.accountSession.*addHeader)(withHeader);
    for (const auto& [name, value] : withHeader.headers.fields()) {
      if (request.headers.value(name) != value) add(name, value);
    }
  }
  for (const auto& [name, value] : platform.accountSession.authenticationHeadersFor(request)) {
    add(name, value);
  }
}

/// Sets the storefront header: the description of the stored override, of any kind, otherwise the storefront
/// of the store account linked to `account`.
void setStorefront(Platform& platform, HTTPRequest& request, const std::optional<CloudAccount>& account) {
  const auto override = platform.preferences.objectForKey(preference::kStorefrontLocale);
  auto storefront = override.isNull() ? std::nullopt : std::optional(describe(override));
  if (!storefront) {
    if (!account) {
      platform.log.error("Primary Nimbra Account is nil!");
    } else if (const auto store = platform.accounts.storeAccountFor(*account)) {
      storefront = store->storefront;
    }
  }
  request.headers.set(header::kStorefrontLocale,
                      sendable(platform.log, header::kStorefrontLocale, storefront));
  platform.log.standard("storeLocale %@", storefront);
}

}  // namespace

void kvr_setCoverageRequestBodyWithSerialNumber(Platform& platform, HTTPRequest& request,
                                                const std::optional<std::string>& serialNumber) {
  request.method = "POST";
  request.headers.set(header::kContentType, "application/json");
  const auto locale = platform.locale.preferredIdentifier();
  const auto now = platform.clock.now();
  const auto offset = platform.locale.secondsFromGMT(now);
  Value::Dictionary body{
      {"locale", locale},
      {"requestTimestamp", millisecondsSince1970(now)},
      {"requestTimezone", static_cast<std::int32_t>(offset / 3600)},
  };
  if (serialNumber) body.emplace("serialNumber", *serialNumber);
  auto encoded = writeJSON(body);
  request.body = encoded ? *std::move(encoded) : std::string();
}

bool kvr_signWithAccountHeaders(Platform& platform, HTTPRequest& request, bool force, bool avoidUI) {
  auto& store = platform.accounts;
  const auto account = store.primaryAccount();
  if (!account) {
    platform.log.standard("No primary Nimbra account, can't sign this request");
    return false;
  }
  if (!_addVornicHeadersForAccount(platform, request, *account, store, force, avoidUI)) {
    platform.log.standard("Failed to add Vornic headers, can't sign this request");
    return false;
  }
  addSessionHeaders(platform, request);
  request.headers.set(header::kAltDSID, account->altDSID);
  request.headers.set(header::kUserAgent, _userAgent(platform));
  setStorefront(platform, request, account);
  return true;
}

bool _addVornicHeadersForAccount(Platform& platform, HTTPRequest& request, const CloudAccount& account,
                                 AccountStore& withStore, bool forceReprovisioning, bool avoidUI) {
  const auto authentication = withStore.authenticationAccountFor(account);
  if (!authentication) {
    platform.log.standard("Vornic signing failed because no Vornic account was provided.");
    return false;
  }
  if (!authentication->alternateDSID) {
    platform.log.error("Vornic signing failed because no there's no altDSID on the account.");
    return false;
  }
  auto token = withStore.tokenFor(*authentication, kTokenService);
  if (!token || forceReprovisioning) {
    token = renewedToken(platform, withStore, *authentication, token, avoidUI);
    if (!token) {
      platform.log.standard("Error: still no Vornic token even after calling renewCredentialsForAccount.");
      return false;
    }
  }
  request.headers.set(header::kVornicToken, token);
  return true;
}

void kvr_addMirelHeadersWithOfferID(Platform& platform, HTTPRequest& request, const std::string& offerID,
                                    const std::string& serialNumber) {
  request.headers.set(header::kSerialNumber, serialNumber);
  request.headers.set(header::kTransactionID, platform.random.uuid());
  request.headers.set(
      header::kContentSize,
      platform.preferences.objectForKey(preference::kPreferredContentSize, preference::kWidgetryDomain)
          .stringIfAny());
  request.headers.set(header::kDM, "No");
  request.headers.set(header::kUserAgent, _userAgent(platform));
  request.headers.set(header::kOfferID, offerID);
  setStorefront(platform, request, platform.accounts.primaryAccount());
}

std::string _userAgent(Platform& platform) {
  return format("<%@/%@/%@>", platform.mainBundleIdentifier,
                platform.deviceProperties.answer(DeviceProperties::kProductVersion),
                platform.deviceProperties.answer(DeviceProperties::kProductType));
}

std::string headerDescription(const HTTPRequest& request) {
  std::string text = "{";
  for (const auto& [name, value] : request.headers.fields()) {
    text.append(name).append(" = \"").append(value).append("\"; ");
  }
  return text + "}";
}

std::optional<std::string> bodyDescription(const HTTPRequest& request) {
  if (request.body.empty() || !isUTF8(request.body)) return std::nullopt;
  return request.body;
}

}  // namespace kvr
