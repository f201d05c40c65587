#pragma once

#include "platform/services/HTTP.h"

#include <string>
#include <vector>

namespace kvr::coverage_service {

/// A request as it came over the wire.
struct ReceivedRequest {
  std::string method;
  std::string path;                         ///< without query, percent escapes resolved
  std::string target;                       ///< as it came
  std::vector<HTTPHeaders::Field> headers;  ///< in their order, repeated ones included
  std::string body;
};

}  // namespace kvr::coverage_service
