#include "CoverageCheck.h"

#include "AttestationCheck.h"
#include "platform/codec/JSON.h"

#include <cmath>
#include <string_view>

namespace kvr::coverage_service {
namespace {

using Fault = std::optional<std::string>;

constexpr std::string_view kToken = "X-Tarsil-Vornic-Token";
constexpr std::string_view kDirectoryIdentifier = "altDSID";
constexpr std::string_view kUserAgent = "User-Agent";
constexpr std::string_view kStorefront = "storefrontLocale";
constexpr std::string_view kContentType = "Content-Type";
constexpr std::string_view kSignature = "X-Tarsil-Kest-S";
constexpr std::string_view kChain = "X-Tarsil-Kest";
constexpr std::string_view kTokenService = "com.tarsil.vornic.supportapp.auth";

constexpr double kDay = 86'400;

std::string quoted(std::string_view text) { return "\"" + std::string(text) + "\""; }

/// What stands between the tokens of a JSON text.
struct Punctuation {
  bool hasBlanks = false;
  int commas = 0;
};

Punctuation punctuationOf(std::string_view json) {
  Punctuation found;
  bool isInString = false;
  for (std::size_t at = 0; at < json.size(); ++at) {
    const char c = json[at];
    if (isInString && c == '\\')
      ++at;
    else if (c == '"')
      isInString = !isInString;
    else if (!isInString && std::string_view(" \t\r\n").find(c) != std::string_view::npos)
      found.hasBlanks = true;
    else if (!isInString && c == ',')
      ++found.commas;
  }
  return found;
}

Fault faultOfTimestamp(const Value& timestamp, double now) {
  const bool isUnsigned = timestamp.kind() == Value::Kind::UInt ||
                          (timestamp.kind() == Value::Kind::Int && timestamp.integer() >= 0);
  if (!isUnsigned) return "requestTimestamp is not an unsigned integer";
  if (std::fabs(timestamp.asDouble() / 1000 - now) > kDay) {
    return "requestTimestamp is not in milliseconds within a day of now";
  }
  return std::nullopt;
}

Fault faultOfBody(const std::string& body, double now) {
  const auto document = readJSON(body);
  if (!document) return "the body is not JSON: " + document.error().message;
  if (!document->isDictionary()) return "the body is not an object";
  const auto punctuation = punctuationOf(body);
  if (punctuation.hasBlanks) return "the body is not compact";
  for (const auto* member : {"serialNumber", "locale", "requestTimestamp", "requestTimezone"}) {
    if (!document->contains(member)) return "the body has no member " + quoted(member);
  }
  // A member written twice shows only in the commas: every value is a scalar.
  constexpr int kMembers = 4;
  if (document->dictionary().size() != kMembers) return "the body has members of no meaning";
  if (!(*document)["serialNumber"].isString()) return "serialNumber is not a string";
  if ((*document)["locale"].stringIfAny().value_or("").empty()) return "locale is not a text";
  if (auto fault = faultOfTimestamp((*document)["requestTimestamp"], now)) return fault;
  const Value& timezone = (*document)["requestTimezone"];
  if (timezone.kind() != Value::Kind::Int) return "requestTimezone is not an integer";
  if (timezone.integer() < -12 || timezone.integer() > 14) return "requestTimezone is not in whole hours";
  if (punctuation.commas != kMembers - 1) return "the body has a member twice";
  return std::nullopt;
}

/// Whether a text has the form <a/b/c>; the last part may hold slashes of its own.
bool isUserAgent(std::string_view text) {
  if (text.size() < 2 || text.front() != '<' || text.back() != '>') return false;
  text = text.substr(1, text.size() - 2);
  const auto first = text.find('/');
  const auto second = first == std::string_view::npos ? first : text.find('/', first + 1);
  return first != 0 && second != std::string_view::npos && second > first + 1 && second + 1 < text.size();
}

HTTPHeaders fieldsOf(const ReceivedRequest& request) {
  HTTPHeaders headers;
  for (const auto& [name, value] : request.headers) headers.set(name, value);
  return headers;
}

/// The headers that the accounts call for, as far as they are to have one particular value, in the order in
/// which the request got them: a later one takes an earlier one's place.
HTTPHeaders headersOf(const Value& accounts, const std::optional<std::string>& storefront,
                      const HTTPHeaders& got) {
  HTTPHeaders expected;
  for (const auto* kind : {"clientInfo", "deviceIdentifier", "authentication"}) {
    const Value& list = accounts["sessionHeaders"][kind];
    if (!list.isDictionary()) continue;
    for (const auto& [name, value] : list.dictionary()) expected.set(name, value.stringIfAny());
  }
  const Value& account = accounts["primaryAccount"];
  expected.set(kDirectoryIdentifier, account["altDSID"].stringIfAny());
  expected.set(kStorefront, storefront ? storefront : account["storefront"].stringIfAny());
  // Their values are not the accounts' to say.
  for (const auto name : {kUserAgent, kContentType, kSignature, kChain}) expected.set(name, got.value(name));
  return expected;
}

Fault faultOfAccount(const HTTPHeaders& got, const Value& accounts, const HTTPHeaders& expected) {
  for (const auto& [name, value] : expected.fields()) {
    if (got.value(name) != value) return name + " is not " + quoted(value);
  }
  const Value& account = accounts["primaryAccount"]["authenticationAccount"];
  const auto token = got.value(kToken);
  if (!expected.value(kToken) && token != account["tokens"][kTokenService].stringIfAny() &&
      token != account["renewal"]["tokens"][kTokenService].stringIfAny()) {
    return std::string(kToken) + " is not the account's";
  }
  for (const auto name : {kDirectoryIdentifier, kStorefront}) {
    if (got.value(name) && !expected.value(name)) return std::string(name) + " is not the account's";
  }
  return std::nullopt;
}

Fault faultOfHeaders(const ReceivedRequest& request, const Expectations& expectations) {
  const HTTPHeaders headers = fieldsOf(request);
  if (headers.fields().size() != request.headers.size()) return "a header is there twice";
  if (headers.value(kContentType) != "application/json") return "Content-Type is not application/json";
  if (headers.value(kToken).value_or("").empty()) return "there is no " + std::string(kToken);
  if (!isUserAgent(headers.value(kUserAgent).value_or(""))) return "User-Agent is not of the form <a/b/c>";
  if (expectations.accounts) {
    const auto expected = headersOf(*expectations.accounts, expectations.storefront, headers);
    return faultOfAccount(headers, *expectations.accounts, expected);
  }
  if (headers.value(kDirectoryIdentifier) == "") return "altDSID is empty";
  if (headers.value(kStorefront).value_or("").empty()) return "there is no storefrontLocale";
  if (expectations.storefront && headers.value(kStorefront) != expectations.storefront) {
    return "storefrontLocale is not " + quoted(*expectations.storefront);
  }
  return std::nullopt;
}

Fault faultOfAttestation(const ReceivedRequest& request, const Expectations& expectations) {
  const HTTPHeaders headers = fieldsOf(request);
  const auto signature = headers.value(kSignature);
  const auto chain = headers.value(kChain);
  if (!expectations.isForLocalDevice) {
    if (signature || chain) return "a request about another device is attested";
    return std::nullopt;
  }
  if (!signature && !chain && !expectations.needsAttestation) return std::nullopt;
  if (!signature) return "there is no " + std::string(kSignature);
  if (!chain) return "there is no " + std::string(kChain);
  if (expectations.needsAttestation && !expectations.authority) return "the authority's file cannot be read";
  return faultOf(Attestation{*signature, *chain, request.body}, expectations.authority);
}

}  // namespace

std::optional<std::string> faultOf(const ReceivedRequest& request, const Expectations& expectations) {
  if (request.method != "POST") return "the method is not POST";
  if (auto fault = faultOfHeaders(request, expectations)) return fault;
  if (auto fault = faultOfBody(request.body, expectations.now)) return fault;
  return faultOfAttestation(request, expectations);
}

}  // namespace kvr::coverage_service
