#pragma once

#include "platform/Platform.h"

#include <optional>
#include <string>

namespace kvr {

// The parts that the agent adds to a request for the coverage service. Each operation changes the request in
// place, queries the platform each time and keeps no state. A coverage request is built in this order:
// account headers (nothing is sent when that fails), body, attestation headers (KestHeaders.h), which sign
// the body.

/// Makes the request a POST with a JSON body that names the device's serial number and the client's locale
/// and clock. Replaces any earlier body. Any thread.
void kvr_setCoverageRequestBodyWithSerialNumber(Platform& platform, HTTPRequest& request,
                                                const std::optional<std::string>& serialNumber);

/// Adds the account token and the account's headers; a header of the account session that cannot be sent is
/// left out and logged as an error. `force` renews the token even if there is one. A renewal blocks the
/// calling thread for up to 60 s, so do not call this on the thread that delivers renewals. Returns false,
/// and adds nothing, if the request cannot be signed.
bool kvr_signWithAccountHeaders(Platform& platform, HTTPRequest& request, bool force, bool avoidUI);
/// The token part of signing: true when the token header was set.
bool _addVornicHeadersForAccount(Platform& platform, HTTPRequest& request, const CloudAccount& account,
                                 AccountStore& withStore, bool forceReprovisioning, bool avoidUI);

/// Adds the headers of an offer request.
void kvr_addMirelHeadersWithOfferID(Platform& platform, HTTPRequest& request, const std::string& offerID,
                                    const std::string& serialNumber);

/// "<bundle/OS version/product type>".
std::string _userAgent(Platform& platform);

/// The whole header dictionary as text, nothing masked; for the log.
std::string headerDescription(const HTTPRequest& request);
/// The body as text; nothing when there is none or it is not UTF-8.
std::optional<std::string> bodyDescription(const HTTPRequest& request);

}  // namespace kvr
