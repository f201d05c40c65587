#include "core/signing/KestHeaders.h"

#include "core/signing/KVRKestManager.h"
#include "platform/codec/JSON.h"

namespace kvr {

namespace {

constexpr std::string_view kAddHeadersWithBody =
    "-[HTTPRequest(AccountHeaders) addKestAuthenticationHeadersWithBody:]";
constexpr std::string_view kAddHeadersWithSerialNumber =
    "-[HTTPRequest(AccountHeaders) addKestAuthenticationHeadersWithSerialNumber:]";

}  // namespace

void addKestAuthenticationHeadersWithBody(Platform& platform, HTTPRequest& request, std::string_view body) {
  platform.log.standard("%s: Initiating device authentication", kAddHeadersWithBody);

  KVRKestManager manager(platform);
  const bool succeeded =
      manager.generateKestCertficate([&log = platform.log](const auto&, const auto&, const auto& error) {
        if (error)
          log.error("Device authentication failed while generating certificate with error: %@", *error);
      });
  platform.log.standard("Kest certificate generation success: %@", succeeded ? 1 : 0);
  if (!succeeded) return;

  std::optional<Error> error;
  if (manager.addKestAuthenticationHeadersToRequest(request, body, error)) {
    platform.log.standard("Device authentication successful");
  } else {
    platform.log.error("Device authentication failed with error: %@", error);
  }
}

void addKestAuthenticationHeadersWithSerialNumber(Platform& platform, HTTPRequest& request,
                                                  const std::string& serialNumber) {
  const auto body = writeJSON(Value::Dictionary{{"serialNumber", serialNumber}});
  if (!body) {
    platform.log.error("%s: %@", kAddHeadersWithSerialNumber, body.error());
    return;
  }
  addKestAuthenticationHeadersWithBody(platform, request, *body);
}

}  // namespace kvr
