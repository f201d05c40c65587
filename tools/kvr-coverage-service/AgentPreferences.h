#pragma once

#include <string>

namespace kvr::coverage_service {

/// Makes this user's agent ask the service at `url` ("http://HOST:PORT") from its next request on, by setting
/// the three URLs in its preferences. False if they cannot be stored; the reason is logged.
bool directAgentTo(const std::string& url);

}  // namespace kvr::coverage_service
