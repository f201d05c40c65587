#pragma once

#include "Behaviours.h"
#include "ReceivedRequest.h"
#include "RequestRecords.h"
#include "WireServer.h"

#include <memory>
#include <optional>
#include <string>

namespace kvr::coverage_service {

/// The two endpoints, answered from files that are read at each request, and the control endpoint.
class Service {
 public:
  struct Options {
    std::string root;
    std::string tls;         ///< path that the TLS authority's certificate is written to; empty without TLS
    std::string authority;   ///< path of a certificate file; empty for none
    std::string accounts;    ///< path of a property list; empty for none
    std::string storefront;  ///< empty: the account's own
  };

  /// Throws when the certificates cannot be made. Adds its handlers to `server`, which must stop serving
  /// before this is destroyed.
  Service(WireServer& server, Options options);
  Service(const Service&) = delete;
  Service& operator=(const Service&) = delete;

 private:
  struct Answer {
    int status = 200;
    std::string body;
    const char* type = "text/plain";
    std::optional<std::string> reason;  ///< why the request was refused
  };

  void handle(const httplib::Request& request, httplib::Response& response);
  void handleControl(const httplib::Request& request, httplib::Response& response);
  Answer coverage(const ReceivedRequest& request, Behaviour& behaviour);
  Answer asset(const ReceivedRequest& request, Behaviour& behaviour);
  /// Why a coverage request is refused, if it is.
  std::optional<std::string> faultIn(const ReceivedRequest& request) const;
  std::optional<std::string> coverageFile(const std::string& serialNumber, const std::string& locale) const;

  std::unique_ptr<tls::Stream> acceptTLS(int socket);

  const Options options_;
  const tls::Authority tlsAuthority_;
  WireServer& server_;
  Behaviours behaviours_;
  RequestRecords records_;
};

}  // namespace kvr::coverage_service
