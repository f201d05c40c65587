#include "Service.h"

#include "CoverageCheck.h"
#include "ReadFile.h"
#include "platform/codec/JSON.h"
#include "platform/codec/PropertyList.h"

#include <algorithm>
#include <chrono>
#include <fstream>
#include <stdexcept>
#include <utility>

namespace kvr::coverage_service {
namespace {

constexpr std::string_view kLocalDevicePath = "/api/v3/coverage/summary";
constexpr std::string_view kOtherDevicesPath = "/api/v2/coverage/summary";
constexpr std::string_view kAssetPath = "/library/TARSIL/asset/kvrV2.plist";
constexpr std::size_t kOversize = (std::size_t{1} << 20) + 1;

/// Whether a text from outside is safe to use in a file name.
bool isFileName(std::string_view text, std::string_view allowedMarks, std::size_t longest) {
  return !text.empty() && text.size() <= longest && text.find("..") == std::string_view::npos &&
         std::ranges::all_of(text, [&](char c) {
           return (c >= 'a' && c <= 'z') || (c >= 'A' && c <= 'Z') || (c >= '0' && c <= '9') ||
                  allowedMarks.find(c) != std::string_view::npos;
         });
}

double secondsSince1970() {
  return std::chrono::duration<double>(std::chrono::system_clock::now().time_since_epoch()).count();
}

/// Sends malformed or forbidden output instead of an answer.
void sendRaw(Connection& connection, const Behaviour& behaviour) {
  bool isOpen = connection.send(*behaviour.raw);
  while (isOpen && !behaviour.repeat.empty()) {
    isOpen = (behaviour.pace <= 0 || connection.wait(behaviour.pace)) && connection.send(behaviour.repeat);
  }
  if (isOpen && behaviour.end == Behaviour::End::Hold) connection.wait(-1);
  if (behaviour.end == Behaviour::End::Reset) connection.reset();
  connection.abandon();
}

void write(httplib::Response& response, std::string body, const char* type, Behaviour::Body kind) {
  switch (kind) {
    case Behaviour::Body::Plain:
      break;
    case Behaviour::Body::Garbage:
      body = "<<neither JSON nor a property list";
      break;
    case Behaviour::Body::Oversize:
      if (body.size() < kOversize) body.resize(kOversize, ' ');
      break;
    case Behaviour::Body::Truncated:
      if (body.empty()) body = " ";
      const std::size_t length = body.size();
      response.set_content_provider(
          length, type,
          [half = body.substr(0, length / 2)](std::size_t, std::size_t, httplib::DataSink& sink) {
            sink.write(half.data(), half.size());
            return false;
          });
      return;
  }
  response.set_content(body, type);
}

}  // namespace

Service::Service(WireServer& server, Options options)
    : options_(std::move(options)), server_(server), records_(options_.root + "/requests") {
  if (!options_.tls.empty()) {
    std::ofstream out(options_.tls, std::ios::binary | std::ios::trunc);
    out << tlsAuthority_.pem();
    out.close();
    if (!out) throw std::runtime_error("cannot write " + options_.tls);
    server.serveTLS([this](int socket) { return acceptTLS(socket); });
  }
  const httplib::Server::Handler control = [this](const auto& request, auto& response) {
    handleControl(request, response);
  };
  server.Post("/control", control).Get("/control/requests", control);
  const httplib::Server::Handler any = [this](const auto& request, auto& response) {
    handle(request, response);
  };
  server.Get(".*", any).Post(".*", any).Put(".*", any).Patch(".*", any).Delete(".*", any).Options(".*", any);
  server.set_exception_handler([](const auto&, auto& response, std::exception_ptr thrown) {
    response.status = 500;
    try {
      std::rethrow_exception(std::move(thrown));
    } catch (const std::exception& error) {
      response.set_content(error.what(), "text/plain");
    }
  });
}

void Service::handle(const httplib::Request& request, httplib::Response& response) {
  Connection& connection = WireServer::connection();
  const ReceivedRequest received{request.method, request.version, connection.tlsVersion(),
                                 request.path,   request.target,  connection.headers(),
                                 request.body};
  Behaviour behaviour;
  Answer answer{404, "no such path", "text/plain", std::nullopt};
  if (request.path == kLocalDevicePath || request.path == kOtherDevicesPath) {
    answer = coverage(received, behaviour);
  } else if (request.path == kAssetPath) {
    answer = asset(received, behaviour);
  }
  const int status = behaviour.status.value_or(answer.status);
  records_.add(received, behaviour.never || behaviour.raw ? 0 : status, answer.reason);

  if (behaviour.never) connection.wait(-1);
  if (behaviour.never || (behaviour.late > 0 && !connection.wait(behaviour.late)))
    return connection.abandon();
  if (behaviour.raw) return sendRaw(connection, behaviour);
  response.status = status;
  if (behaviour.redirect) response.set_header("Location", *behaviour.redirect);
  write(response, std::move(answer.body), answer.type, behaviour.body);
}

Service::Answer Service::coverage(const ReceivedRequest& request, Behaviour& behaviour) {
  if (auto fault = faultIn(request)) return {400, *fault, "text/plain", fault};
  const auto document = readJSON(request.body);
  const std::string serialNumber = (*document)["serialNumber"].string();
  behaviour = behaviours_.next("coverage", serialNumber);
  auto content = coverageFile(serialNumber, (*document)["locale"].string());
  if (!content) return {404, "{}", "application/json", std::nullopt};
  return {200, *std::move(content), "application/json", std::nullopt};
}

Service::Answer Service::asset(const ReceivedRequest& request, Behaviour& behaviour) {
  if (request.method != "GET") return {405, "the method is not GET", "text/plain", std::nullopt};
  behaviour = behaviours_.next("asset", std::nullopt);
  auto content = readFile(options_.root + "/kvrV2.plist");
  if (!content) return {404, "no such file", "text/plain", std::nullopt};
  return {200, *std::move(content), "application/octet-stream", std::nullopt};
}

std::optional<std::string> Service::faultIn(const ReceivedRequest& request) const {
  Expectations expectations;
  expectations.isForLocalDevice = request.path == kLocalDevicePath;
  expectations.now = secondsSince1970();
  if (!options_.authority.empty()) {
    expectations.needsAttestation = true;
    expectations.authority = readFile(options_.authority);
  }
  if (!options_.accounts.empty()) {
    const auto content = readFile(options_.accounts);
    if (!content) return "the accounts' file cannot be read";
    const auto accounts = readPropertyList(*content);
    if (!accounts) return "the accounts' file is no property list: " + accounts.error().message;
    expectations.accounts = *accounts;
  }
  if (!options_.storefront.empty()) expectations.storefront = options_.storefront;
  return faultOf(request, expectations);
}

std::optional<std::string> Service::coverageFile(const std::string& serialNumber,
                                                 const std::string& locale) const {
  const std::string directory = options_.root + "/coverage/";
  if (isFileName(serialNumber, "_-", 64)) {
    if (isFileName(locale, "_@.-", 128)) {
      if (auto content = readFile(directory + serialNumber + "." + locale + ".json")) return content;
    }
    if (auto content = readFile(directory + serialNumber + ".json")) return content;
  }
  return readFile(directory + "default.json");
}

void Service::handleControl(const httplib::Request& request, httplib::Response& response) {
  if (request.path == "/control") {
    const auto document = readJSON(request.body);
    const auto fault = document ? behaviours_.set(*document) : std::optional(document.error());
    response.status = fault ? 400 : 200;
    response.set_content(fault ? fault->message : "{}", fault ? "text/plain" : "application/json");
    return;
  }
  const auto& tls = server_.tlsCounts();
  const Value counts = Value::Dictionary{
      {"count", records_.count()}, {"connections", tls.connections.load()}, {"bytes", tls.bytes.load()}};
  response.set_content(*writeJSON(counts), "application/json");
}

std::unique_ptr<tls::Stream> Service::acceptTLS(int socket) {
  const Behaviour behaviour = behaviours_.next("connection", std::nullopt);
  return tls::Stream::accept(socket, tlsAuthority_.issue(behaviour.flaw), behaviour.newestTLS);
}

}  // namespace kvr::coverage_service
