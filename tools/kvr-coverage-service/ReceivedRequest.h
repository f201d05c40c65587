#pragma once

#include "platform/services/HTTP.h"

#include <string>
#include <vector>

namespace kvr::coverage_service {

/// A request as it arrived.
struct ReceivedRequest {
  std::string method;
  std::string version;                      ///< of HTTP
  std::string tls;                          ///< the version of TLS; empty without
  std::string path;                         ///< without query, percent escapes resolved
  std::string target;                       ///< unchanged
  std::vector<HTTPHeaders::Field> headers;  ///< in order, repeated ones included
  std::string body;
};

}  // namespace kvr::coverage_service
