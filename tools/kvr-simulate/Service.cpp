#include "kvr-simulate/Service.h"

#include "core/signing/SigningKeys.h"
#include "kvr-simulate/Epochs.h"
#include "platform/codec/JSON.h"

#include <algorithm>

namespace kvr::simulate {
namespace {

constexpr double kDay = 86400;
constexpr const char* kVersions = "{ LowServerVersion = 2; HighServerVersion = 3; }";

HTTPResponse status(int code, std::string body) { return {code, std::move(body), std::nullopt}; }

HTTPResponse failure(int code, const char* message) {
  return {0, std::nullopt, Error{"http", code, message}};
}

std::optional<Date> dateIn(const Value::Dictionary& epochs, const char* key) {
  const auto found = epochs.find(key);
  return found == epochs.end() ? std::nullopt : dateOf(found->second);
}

}  // namespace

std::optional<Date> Offer::end() const { return dateIn(epochs, "zubOfferEligibleUntil"); }

std::optional<Date> Offer::displayed() const { return dateIn(epochs, "zubOfferFollowupDisplayDate"); }

std::optional<Date> Offer::postDate(std::optional<Date> activation) const {
  auto date = displayed();
  if (!date && end()) date = *end() - daysBeforeEnd * kDay;
  if (date && activation && *activation > *date) date = activation;
  return date;
}

std::size_t Service::publish(Offer offer) {
  const auto number = offers_.size();
  current_[offer.serialNumber] = number;
  offers_.push_back(std::move(offer));
  return number;
}

std::size_t Service::currentOf(const std::string& serialNumber) {
  const auto found = current_.find(serialNumber);
  if (found != current_.end()) return found->second;
  Offer none;
  none.serialNumber = serialNumber;
  return publish(std::move(none));
}

bool Service::areOpen(const std::string& serialNumber, double time, Date now) const {
  return std::ranges::all_of(offers_, [&](const Offer& offer) {
    return offer.serialNumber != serialNumber || offer.lastServed < time || offer.isOpen(now);
  });
}

Offer* Service::find(const Value& label) {
  if (!label.isString() || !label.string().starts_with("Offer ")) return nullptr;
  const auto number = static_cast<std::size_t>(std::stoul(label.string().substr(6)));
  return number < offers_.size() ? &offers_[number] : nullptr;
}

Value Service::treeOf(std::size_t number) const {
  const auto& offer = offers_[number];
  Value::Dictionary tree{{"covered", offer.isCovered},
                         {"zubLocalizedOfferLabel", labelOf(number)},
                         {"zubLocalizedOfferSingularDesc", "1 day left"},
                         {"zubLocalizedOfferPluralDescFormat", "%@ days left"},
                         {"zubLocalizedOfferCTA", "Add"},
                         {"featureToggleParameters",
                          Value::Dictionary{{"zubOfferDisplay", offer.isOffered},
                                            {"zubOfferDurationDaysBeforeEndDate", offer.daysBeforeEnd}}}};
  tree.insert(offer.epochs.begin(), offer.epochs.end());
  return tree;
}

Service::Outcome Service::fail(Fault fault) {
  switch (fault) {
    case Fault::Refuses:
      return {status(401, "{}"), dice_.between(0.05, 2), std::nullopt};
    case Fault::Breaks:
      return {status(dice_.oneOf({500, 503, 302, 404}), "<html>"), dice_.between(0.05, 2), std::nullopt};
    case Fault::Never:
      return {};
    case Fault::Garbage:
      return {status(200, dice_.oneOf({"", "{", "{\"a\": 1} x", "\xff\xfe", "\x01"})), 0.1, std::nullopt};
    case Fault::Null:
      return {status(200, dice_.oneOf({"null", "[]", "7", "\"text\""})), 0.1, std::nullopt};
    case Fault::Giant:
      return {HTTPResponse{200, std::nullopt, Error{"http", 63, "The body is too large."}}, 5, std::nullopt};
    case Fault::Deep:
      return {status(200, std::string(600, '[') + std::string(600, ']')), 0.1, std::nullopt};
    case Fault::Other:
      return {status(200, R"({"zubOfferEligibleUntil": "soon", "featureToggleParameters": [null]})"), 0.1,
              std::nullopt};
    default:
      return {failure(7, "Could not connect to the server."), 0.1, std::nullopt};
  }
}

Service::Outcome Service::answerVersions() {
  const bool strikes = versionFault != Fault::None && dice_.happens(faultShare);
  if (strikes && versionFault != Fault::Late) return fail(versionFault);
  return {status(200, kVersions), strikes ? dice_.between(5, 90) : dice_.between(0.05, 2), std::nullopt};
}

Service::Outcome Service::answerCoverage(const HTTPRequest& request) {
  const bool strikes = coverageFault != Fault::None && dice_.happens(faultShare);
  if (strikes && coverageFault != Fault::Late) return fail(coverageFault);
  const double delay = strikes ? dice_.between(5, 90) : dice_.between(0.05, 2);
  if (request.headers.value(header::kVornicToken) != validToken) {
    return {status(401, "{}"), delay, std::nullopt};
  }
  const auto body = readJSON(request.body);
  const auto serialNumber = body ? (*body)["serialNumber"].stringIfAny() : std::nullopt;
  if (!serialNumber) return {status(400, "{}"), delay, std::nullopt};
  const auto number = currentOf(*serialNumber);
  return {status(200, *writeJSON(treeOf(number))), delay, number};
}

}  // namespace kvr::simulate
