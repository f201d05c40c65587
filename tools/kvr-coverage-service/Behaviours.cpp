#include "Behaviours.h"

namespace kvr::coverage_service {
namespace {

Error failure(std::string message) { return {"control", 0, std::move(message)}; }

bool isWhole(const Value& value, std::int64_t least, std::int64_t most) {
  return value.kind() == Value::Kind::Int && value.integer() >= least && value.integer() <= most;
}

std::optional<Behaviour::Body> bodyNamed(const std::string& name) {
  if (name == "garbage") return Behaviour::Body::Garbage;
  if (name == "truncated") return Behaviour::Body::Truncated;
  if (name == "oversize") return Behaviour::Body::Oversize;
  return std::nullopt;
}

std::optional<tls::Flaw> flawNamed(const std::string& name) {
  if (name == "self-signed") return tls::Flaw::SelfSigned;
  if (name == "unknown") return tls::Flaw::Unknown;
  if (name == "elsewhere") return tls::Flaw::Elsewhere;
  if (name == "expired") return tls::Flaw::Expired;
  if (name == "early") return tls::Flaw::Early;
  return std::nullopt;
}

std::optional<Behaviour::End> endNamed(const std::string& name) {
  if (name == "close") return Behaviour::End::Close;
  if (name == "reset") return Behaviour::End::Reset;
  if (name == "hold") return Behaviour::End::Hold;
  return std::nullopt;
}

}  // namespace

const char* const Behaviours::kHelp =
    R"(Misbehaviour is told by POST /control with {"coverage": [RULE...], "asset": [RULE...], "connection": [RULE...]};
an endpoint that is named gets these rules in place of its former ones. The first rule that fits a request decides, or
one of "connection" that fits a new connection over TLS. Members of a RULE, all optional:
  "status": N           answer this status (with "redirect": 302 unless given)
  "redirect": URL       answer a redirect to there
  "body": KIND          "garbage", "truncated" or "oversize"
  "late": SECONDS       answer only then
  "never": true         hold the request until the client goes
  "raw": TEXT           send this in place of an answer, status line and all
  "repeat": TEXT        after "raw", send this until the client goes
  "pace": SECONDS       wait so long before each "repeat"
  "end": KIND           after "raw" without "repeat": "close" (the default), "reset" or "hold" the connection
  "certificate": KIND   of a connection: "self-signed", "unknown" (its authority), "elsewhere" (another host's),
                        "expired" or "early" (not valid yet)
  "oldTLS": true        of a connection: offer nothing above TLS 1.1
  "serialNumber": TEXT  only requests about this device
  "every": N            only each Nth request that would fit, beginning with the Nth
  "times": N            only this often
GET /control/requests answers {"count": N, "connections": N, "bytes": N}: the number of the last request recorded, of the
connections that began with TLS, and of the bytes that were received through them.)";

std::optional<Error> Behaviours::set(const Value& document) {
  if (!document.isDictionary()) return failure("not an object");
  std::map<std::string, Rules, std::less<>> changed;
  for (const auto& [endpoint, list] : document.dictionary()) {
    if (endpoint != "coverage" && endpoint != "asset" && endpoint != "connection") {
      return failure("no endpoint is called " + endpoint);
    }
    if (!list.isArray()) return failure("the rules of " + endpoint + " are not an array");
    Rules& rules = changed[endpoint];
    for (const Value& element : list.array()) {
      auto rule = ruleOf(element);
      if (!rule) return rule.error();
      rules.push_back(*std::move(rule));
    }
  }
  const std::lock_guard lock(mutex_);
  for (auto& [endpoint, rules] : changed) rules_[endpoint] = std::move(rules);
  return std::nullopt;
}

Result<Behaviours::Rule> Behaviours::ruleOf(const Value& document) {
  if (!document.isDictionary()) return failure("a rule is not an object");
  Rule rule;
  for (const auto& [name, value] : document.dictionary()) {
    if (const auto fault = takeMember(rule, name, value)) return failure("\"" + name + "\" " + *fault);
  }
  if (rule.behaviour.redirect && !rule.behaviour.status) rule.behaviour.status = 302;
  return rule;
}

std::optional<std::string> Behaviours::takeMember(Rule& rule, const std::string& name, const Value& value) {
  constexpr std::int64_t kMost = 1'000'000'000;
  const auto text = value.stringIfAny();
  if (name == "status") {
    if (!isWhole(value, 200, 599)) return "is not a status";
    rule.behaviour.status = static_cast<int>(value.integer());
  } else if (name == "redirect") {
    if (!text || text->find_first_of("\r\n") != std::string::npos) return "is not a location";
    rule.behaviour.redirect = text;
  } else if (name == "body") {
    const auto body = text ? bodyNamed(*text) : std::nullopt;
    if (!body) return "is not a kind of body";
    rule.behaviour.body = *body;
  } else if (name == "late") {
    if (!value.isNumber() || !(value.asDouble() >= 0)) return "is not a number of seconds";
    rule.behaviour.late = value.asDouble();
  } else if (name == "never") {
    if (!value.isBool()) return "is not a bool";
    rule.behaviour.never = value.boolean();
  } else if (name == "raw" || name == "repeat") {
    if (!text) return "is not a string";
    (name == "raw" ? rule.behaviour.raw.emplace() : rule.behaviour.repeat) = *text;
  } else if (name == "pace") {
    if (!value.isNumber() || !(value.asDouble() >= 0)) return "is not a number of seconds";
    rule.behaviour.pace = value.asDouble();
  } else if (name == "end") {
    const auto end = text ? endNamed(*text) : std::nullopt;
    if (!end) return "is not an end";
    rule.behaviour.end = *end;
  } else if (name == "certificate") {
    const auto flaw = text ? flawNamed(*text) : std::nullopt;
    if (!flaw) return "is not a kind of certificate";
    rule.behaviour.flaw = *flaw;
  } else if (name == "oldTLS") {
    if (!value.isBool()) return "is not a bool";
    if (value.boolean()) rule.behaviour.newestTLS = TLS1_1_VERSION;
  } else if (name == "serialNumber") {
    if (!text) return "is not a string";
    rule.serialNumber = text;
  } else if (name == "every") {
    if (!isWhole(value, 1, kMost)) return "is not a count";
    rule.every = value.integer();
  } else if (name == "times") {
    if (!isWhole(value, 0, kMost)) return "is not a count";
    rule.times = value.integer();
  } else {
    return "is not known";
  }
  return std::nullopt;
}

Behaviour Behaviours::next(std::string_view endpoint, const std::optional<std::string>& serialNumber) {
  const std::lock_guard lock(mutex_);
  const auto rules = rules_.find(endpoint);
  if (rules == rules_.end()) return {};
  for (Rule& rule : rules->second) {
    if (rule.times == 0 || (rule.serialNumber && rule.serialNumber != serialNumber)) continue;
    if (++rule.seen % rule.every != 0) continue;
    if (rule.times > 0) --rule.times;
    return rule.behaviour;
  }
  return {};
}

}  // namespace kvr::coverage_service
