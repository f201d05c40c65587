#pragma once

#include "platform/Platform.h"

#include <string>
#include <string_view>

namespace kvr {

// The account headers that prove which device a request comes from. Both operations block the
// calling thread for up to 60 seconds while the attestation service works. They never fail: a header that
// cannot be made is left out, and the log says why.

/// Attests this device and adds signature and certificate chain for `body`, which must be sent as it is.
void addKestAuthenticationHeadersWithBody(Platform& platform, HTTPRequest& request, std::string_view body);

/// The same for the JSON object `{"serialNumber":…}`; the request's own body stays as it is.
void addKestAuthenticationHeadersWithSerialNumber(Platform& platform, HTTPRequest& request,
                                                  const std::string& serialNumber);

}  // namespace kvr
