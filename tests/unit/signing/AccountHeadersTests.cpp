#include "core/signing/AccountHeaders.h"
#include "unit/CoverageWorld.h"

namespace kvr {
namespace {

constexpr const char* kService = "com.tarsil.vornic.supportapp.auth";

struct ACoverageRequest : CoverageTest {
  bool sign(bool force) { return kvr_signWithAccountHeaders(world.platform, request, force, true); }

  HTTPRequest request;
};

TEST_F(ACoverageRequest, SaysWhichDeviceAndWhenAndWhere) {
  world.locale.identifier = "pt_BR";
  const std::tuple<double, long, std::int64_t, int> cases[] = {
      {1'800'000'000.9999, 19800, 1'800'000'000'999, 5},
      {1, -12600, 1000, -3},
      {-5, 3599, 0, 0},
      {20'000'000'000, 0, 20'000'000'000'000, 0}};
  for (const auto& [now, offset, milliseconds, hours] : cases) {
    world.clock.set(Date{now});
    world.locale.offset = offset;
    request.body = "before";
    kvr_setCoverageRequestBodyWithSerialNumber(world.platform, request, "S/\"é");
    EXPECT_EQ(request.body, format("{\"locale\":\"pt_BR\",\"requestTimestamp\":%ld,\"requestTimezone\":%d,"
                                   "\"serialNumber\":\"S/\\\"é\"}",
                                   milliseconds, hours));
    EXPECT_EQ(bodyDescription(request), request.body);
  }
  EXPECT_EQ(request.method, "POST");
  EXPECT_EQ(request.headers.value("content-type"), "application/json");
  request.body = "\xff";
  EXPECT_EQ(bodyDescription(request), std::nullopt);
}

TEST_F(ACoverageRequest, CarriesTheAccountsHeadersInTheirOrder) {
  world.accountSession.clientInfo = {{"X-Client", "info"}};
  world.accountSession.deviceIdentifier = {{"X-Device", "id"}};
  world.accountSession.authentication = {{"X-Auth", "proof"}, {"x-client", "replaced"}};
  EXPECT_TRUE(sign(false));
  EXPECT_THAT(request.headers.fields(),
              ElementsAre(Pair("X-Tarsil-Vornic-Token", "token"), Pair("x-client", "replaced"),
                          Pair("X-Device", "id"), Pair("X-Auth", "proof"), Pair("altDSID", "alt-dsid"),
                          Pair("User-Agent", "<com.tarsil.kvragent/17.9/Phone1,2>"),
                          Pair("storefrontLocale", "143441")));
  EXPECT_THAT(world.log.texts(), ElementsAre("storeLocale 143441"));
}

TEST_F(ACoverageRequest, LeavesOutHeadersThatCannotBeSentAndNoOthers) {
  world.accountSession.clientInfo = {{"X-Client", "a\r\nX-Forged: b"}, {"X Device", "id"}, {"X-Good", "1"}};
  world.accountSession.deviceIdentifier = {{"content-length", "7"}, {"X-Good", "\r"}, {"X-Vornic", "2"}};
  world.accountSession.authentication = {{"X-Auth", std::string("a\0b", 3)}, {"X-Tarsil-Vornic-Token", "\n"}};
  world.preferences.setObject(Array{"a\nb"}, "storefrontLocale");
  EXPECT_TRUE(sign(false));
  EXPECT_THAT(request.headers.fields(),
              ElementsAre(Pair("X-Tarsil-Vornic-Token", "token"), Pair("X-Good", "1"), Pair("X-Vornic", "2"),
                          Pair("altDSID", "alt-dsid"), Pair("User-Agent", ::testing::_)));
  EXPECT_EQ(world.log.texts(LogLevel::Error).size(), 7U);
  EXPECT_TRUE(world.log.contains("header 'content-length' is left out, it cannot be sent: "));
}

TEST_F(ACoverageRequest, LeavesOutWhatThePlatformDoesNotKnow) {
  world.deviceProperties.answers.clear();
  world.accounts.primary = CloudAccount{};
  world.accounts.store.reset();
  EXPECT_TRUE(sign(false));
  EXPECT_THAT(request.headers.fields(),
              ElementsAre(Pair("X-Tarsil-Vornic-Token", "token"),
                          Pair("User-Agent", "<com.tarsil.kvragent/(null)/(null)>")));
  world.preferences.setObject("override", "storefrontLocale");
  world.accounts.store = StoreAccount{1, "account"};
  EXPECT_TRUE(sign(false));
  EXPECT_EQ(request.headers.value("storefrontLocale"), "override");
  world.preferences.setObject(143465, "storefrontLocale");
  EXPECT_TRUE(sign(false));
  EXPECT_EQ(request.headers.value("storefrontLocale"), "143465");
}

TEST_F(ACoverageRequest, RenewsTheTokenWhenThereIsNoneOrWhenForced) {
  using Renewal = SimulatedAccountStore::Renewal;
  const Renewal succeeds{0, {{kService, "new"}}};
  const Renewal bringsNothing{0, {}};
  const Renewal fails{7, {{kService, "new"}}, 0, Error{"accounts", 7, "no"}};
  const Renewal never{0, {}, 0, {}, true};
  const std::string failed =
      "No way to sign request with Vornic token because renewal of Vornic credential failed: ";
  const std::string refused = failed + "7, Error Domain=accounts Code=7 \"no\"";
  const std::string late = failed + "-1, Error Domain=accounts Code=-1 \"no answer within 60 seconds\"";
  struct Outcome {
    std::optional<std::string> token;
    std::size_t renewals = 0;
    double seconds = 0;
    std::vector<std::string> errors = {};
  };
  const auto expect = [&](bool held, bool force, const Renewal& renewal, const Outcome& outcome) {
    world.accounts.tokens.clear();
    if (held) world.accounts.tokens[kService] = "held";
    world.accounts.renewal = renewal;
    world.accounts.renewals.clear();
    world.log.clear();
    request = {};
    const auto start = world.clock.now();
    EXPECT_EQ(sign(force), outcome.token.has_value());
    EXPECT_EQ(world.clock.now() - start, outcome.seconds);
    EXPECT_EQ(request.headers.value("X-Tarsil-Vornic-Token"), outcome.token);
    EXPECT_EQ(world.accounts.renewals.size(), outcome.renewals);
    for (const auto& it : world.accounts.renewals) {
      EXPECT_TRUE(it.avoidUI);
      EXPECT_THAT(it.services, ElementsAre(kService));
    }
    EXPECT_EQ(world.log.count("Reprovision Vornic tokens"), outcome.renewals);
    EXPECT_EQ(world.log.texts(LogLevel::Error), outcome.errors);
    if (outcome.token) return;
    EXPECT_TRUE(
        world.log.contains("Error: still no Vornic token even after calling renewCredentialsForAccount."));
    EXPECT_THAT(request.headers.fields(), IsEmpty());
  };
  expect(true, false, fails, {"held"});
  expect(true, true, succeeds, {"new", 1});
  expect(true, true, fails, {"held", 1, 0, {refused}});
  expect(true, true, never, {"held", 1, 60, {late}});
  expect(false, false, succeeds, {"new", 1});
  expect(false, false, bringsNothing, {{}, 1});
  expect(false, false, fails, {{}, 1, 0, {refused}});
}

TEST_F(ACoverageRequest, IsNotSignedWithoutAnAccount) {
  world.accounts.authentication = AuthenticationAccount{};
  EXPECT_FALSE(sign(false));
  world.accounts.authentication.reset();
  EXPECT_FALSE(sign(false));
  world.accounts.primary.reset();
  EXPECT_FALSE(sign(false));
  EXPECT_THAT(world.log.texts(),
              ElementsAre("Vornic signing failed because no there's no altDSID on the account.",
                          "Failed to add Vornic headers, can't sign this request",
                          "Vornic signing failed because no Vornic account was provided.",
                          "Failed to add Vornic headers, can't sign this request",
                          "No primary Nimbra account, can't sign this request"));
  EXPECT_EQ(world.log.texts(LogLevel::Error).size(), 1U);
  EXPECT_THAT(request.headers.fields(), IsEmpty());
}

TEST_F(ACoverageRequest, OffersCarryTheirOwnHeaders) {
  const auto widgetry = "/home/user/Library/Preferences/com.tarsil.Widgetry.plist";
  world.files.putPropertyList(widgetry, Dictionary{{"UIPreferredContentSizeCategoryName", "Large"}});
  kvr_addMirelHeadersWithOfferID(world.platform, request, "offer-7", "SN");
  const auto first = *request.headers.value("X-Tarsil-Txn-ID");
  EXPECT_THAT(request.headers.fields(),
              ElementsAre(Pair("X-Tarsil-SN", "SN"), Pair("X-Tarsil-Txn-ID", first),
                          Pair("X-Tarsil-Content-Size", "Large"), Pair("X-Tarsil-DM", "No"),
                          Pair("User-Agent", "<com.tarsil.kvragent/17.9/Phone1,2>"),
                          Pair("Offer-ID", "offer-7"), Pair("storefrontLocale", "143441")));
  world.files.erase(widgetry);
  world.accounts.primary.reset();
  kvr_addMirelHeadersWithOfferID(world.platform, request, "offer-7", "SN");
  EXPECT_NE(request.headers.value("X-Tarsil-Txn-ID"), first);
  EXPECT_EQ(request.headers.value("X-Tarsil-Content-Size"), std::nullopt);
  EXPECT_EQ(request.headers.value("storefrontLocale"), std::nullopt);
  EXPECT_THAT(world.log.texts(LogLevel::Error), ElementsAre("Primary Nimbra Account is nil!"));
}

}  // namespace
}  // namespace kvr
