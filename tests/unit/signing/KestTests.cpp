#include "platform/Base64.h"
#include "platform/JSON.h"
#include "signing/Base64.h"
#include "signing/KVRKestManager.h"
#include "signing/KestHeaders.h"
#include "signing/SHA256Hash.h"
#include "unit/SimulatedTest.h"

#include <zlib.h>

#include <algorithm>
#include <random>

namespace kvr {
namespace {

using ::testing::ElementsAre;
using ::testing::ElementsAreArray;
using ::testing::IsEmpty;
using ::testing::SizeIs;

constexpr const char* kBegin =
    "-[HTTPRequest(AccountHeaders) addKestAuthenticationHeadersWithBody:]: Initiating device authentication";
constexpr const char* kSupported = "-[KVRKestManager generateKestCertficate:]: isSupported: 1";
constexpr const char* kUnsupported = "-[KVRKestManager generateKestCertficate:]: isSupported: 0";
constexpr const char* kGenerated = "Kest certificate generation success: 1";
constexpr const char* kNotGenerated = "Kest certificate generation success: 0";
constexpr const char* kTimedOut =
    "-[KVRKestManager generateKestCertficate:]: Installation timed out after 60 seconds";

/// Bytes like those of a certificate: the same every time, and without any pattern to compress.
std::string certificate(unsigned seed) {
  std::mt19937 random(seed);
  std::string bytes(600, '\0');
  for (auto& byte : bytes) byte = static_cast<char>(random());
  return bytes;
}

std::string decoded(const std::optional<std::string>& base64) {
  const auto bytes = base64Decode(base64.value_or(""));
  return bytes ? std::string(bytes->begin(), bytes->end()) : "no base64";
}

/// The content of a raw DEFLATE stream that ends exactly where `bytes` end.
std::string inflated(const std::string& bytes) {
  std::string content(1 << 16, '\0');
  z_stream stream{};
  stream.next_in = reinterpret_cast<Bytef*>(const_cast<char*>(bytes.data()));
  stream.avail_in = static_cast<uInt>(bytes.size());
  stream.next_out = reinterpret_cast<Bytef*>(content.data());
  stream.avail_out = static_cast<uInt>(content.size());
  inflateInit2(&stream, -15);
  const int state = inflate(&stream, Z_FINISH);
  inflateEnd(&stream);
  if (state != Z_STREAM_END || stream.avail_in != 0) return "no raw DEFLATE stream";
  content.resize(stream.total_out);
  return content;
}

/// The certificates of a header's value, in base64.
std::vector<std::string> certificatesIn(const std::optional<std::string>& header) {
  const auto tree = readJSON(inflated(decoded(header)));
  std::vector<std::string> certificates;
  if (tree && tree->isDictionary() && tree->dictionary().size() == 1 && (*tree)["certs"].isArray()) {
    for (const auto& text : (*tree)["certs"].array()) certificates.push_back(text.stringIfAny().value_or(""));
  }
  return certificates;
}

class DeviceAttestationHeaders : public SimulatedTest {
 protected:
  DeviceAttestationHeaders() {
    simulated.attestation.preferred.chain = chain;
    simulated.attestation.fallback.chain = chain;
  }

  std::optional<std::string> signature() const { return request.headers.value("X-Tarsil-Kest-S"); }
  std::optional<std::string> chainHeader() const { return request.headers.value("X-Tarsil-Kest"); }
  std::vector<std::string> standardLines() const { return simulated.log.texts(LogLevel::Default); }
  std::vector<std::string> errorLines() const { return simulated.log.texts(LogLevel::Error); }

  const CertificateChain chain = {certificate(1), certificate(2)};
  HTTPRequest request;
};

TEST_F(DeviceAttestationHeaders, CarryTheSignatureOfTheBodyAndTheChain) {
  request.body = std::string("{\"a\":\"\0\"}", 9);
  addKestAuthenticationHeadersWithBody(simulated.platform, request, request.body);

  EXPECT_THAT(simulated.attestation.key->messages, ElementsAre(request.body));
  EXPECT_EQ(decoded(signature()), "signature");
  EXPECT_THAT(certificatesIn(chainHeader()), ElementsAre(base64Encoded(chain[0]), base64Encoded(chain[1])));
  EXPECT_THAT(standardLines(),
              ElementsAre(kBegin, kSupported, kGenerated,
                          "-[KVRKestManager addKestAuthenticationHeadersToRequest:withBody:error:]: "
                          "signatureDataString: " +
                              *signature() + "\n certificateString: " + *chainHeader(),
                          "Device authentication successful"));
  EXPECT_THAT(errorLines(), IsEmpty());
}

struct Failure {
  const char* name;
  std::function<void(SimulatedDeviceAttestation&)> cause;
  std::vector<std::string> standardLines;
  std::vector<std::string> errorLines;
  bool hasSignature = false;
  bool hasChain = false;

  friend void PrintTo(const Failure& failure, std::ostream* out) { *out << failure.name; }
};

std::string issueError(int code) {
  return "Error Domain=com.tarsil.attestation Code=" + std::to_string(code) + " \"not issued\"";
}

std::string fellBack(int code) {
  return "-[KVRKestManager generateKestCertficate:]: Kest (WELD) failed due to missing WELD with error: " +
         issueError(code) + ", falling back to Kest (HASP)";
}

std::string generationFailed(const std::string& error) {
  return "Device authentication failed while generating certificate with error: " + error;
}

std::vector<std::string> headersFailed(std::vector<std::string> before, const std::string& error) {
  before.push_back(
      "-[KVRKestManager addKestAuthenticationHeadersToRequest:withBody:error:]: Failed to add Kest Headers "
      "with "
      "error: " +
      error);
  before.push_back("Device authentication failed with error: " + error);
  return before;
}

std::vector<Failure> failures() {
  using Attestation = SimulatedDeviceAttestation;
  const std::vector<std::string> ungenerated = {kBegin, kSupported, kNotGenerated};
  const std::vector<std::string> generated = {kBegin, kSupported, kGenerated};
  const std::string missing =
      "-[KVRKestManager generateKestCertficate:]: Failed to get reference key or cert!";
  const Error foreign{"elsewhere", -11, "not issued"};
  const Error locked{"keys", 5, "locked"};
  const std::string lockedText = "Error Domain=keys Code=5 \"locked\"";
  const std::string tooLong =
      "Error Domain=zlib Code=0 \"the compressed form is longer than what it is made of\"";
  const auto fallsBackTo = [](Attestation::Outcome outcome) {
    return [outcome](Attestation& attestation) {
      attestation.preferred = Attestation::failed(-11);
      attestation.fallback = outcome;
    };
  };
  return {
      {"not supported",
       [](Attestation& a) { a.supported = false; },
       {kBegin, kUnsupported, kNotGenerated},
       {}},
      {"no access control",
       [=](Attestation& a) { a.accessControlError = locked; },
       ungenerated,
       {"Failed to create access control: " + lockedText}},
      {"another issue error",
       [](Attestation& a) { a.preferred = Attestation::failed(-12); },
       ungenerated,
       {generationFailed(issueError(-12))}},
      {"an error of another domain with the code of a missing certificate",
       [=](Attestation& a) {
         a.preferred = {nullptr, std::nullopt, foreign};
       },
       ungenerated,
       {generationFailed("Error Domain=elsewhere Code=-11 \"not issued\"")}},
      {"an error beside key and chain",
       [](Attestation& a) {
         a.preferred.error = Error{std::string(Attestation::kErrorDomain), 3, "not issued"};
       },
       ungenerated,
       {generationFailed(issueError(3))}},
      {"a key without a chain", [](Attestation& a) { a.preferred.chain.reset(); }, ungenerated, {missing}},
      {"a chain without a key", [](Attestation& a) { a.preferred.key.reset(); }, ungenerated, {missing}},
      {"no certificate of either kind",
       fallsBackTo(Attestation::failed(-4)),
       ungenerated,
       {fellBack(-11), generationFailed(issueError(-4))}},
      {"a fallback key without a chain",
       fallsBackTo({std::make_shared<SimulatedAttestedKey>(), std::nullopt, std::nullopt}),
       ungenerated,
       {fellBack(-11)}},
      {"no answer",
       [](Attestation& a) { a.preferred.never = true; },
       {kBegin, kSupported, kTimedOut, kNotGenerated},
       {}},
      {"an answer just too late",
       [](Attestation& a) { a.preferred.delay = 60.001; },
       {kBegin, kSupported, kTimedOut, kNotGenerated},
       {}},
      {"two issues that take too long together",
       [](Attestation& a) {
         a.preferred = Attestation::failed(-11, 31);
         a.fallback.delay = 30;
       },
       {kBegin, kSupported, kTimedOut, kNotGenerated},
       {fellBack(-11)}},
      {"no signature", [=](Attestation& a) { a.key->signature = locked; }, generated,
       headersFailed({"Unable to sign data and encode with error: " + lockedText}, lockedText), false, true},
      {"a chain that does not shrink",
       [](Attestation& a) {
         a.preferred.chain = CertificateChain{"leaf", "issuer"};
       },
       generated, headersFailed({"Unable to sign request"}, tooLong), true, false},
      {"a chain of empty certificates", [](Attestation& a) { a.preferred.chain = CertificateChain{""}; },
       generated,
       headersFailed({"-[KVRKestManager serializeCertificateChain:]: Found NULL attestation data!!",
                      "Unable to sign request"},
                     tooLong),
       true, false},
      {"neither signature nor chain",
       [=](Attestation& a) {
         a.key->signature = locked;
         a.preferred.chain = CertificateChain{};
       },
       generated,
       headersFailed({"Unable to sign data and encode with error: " + lockedText, "Unable to sign request"},
                     lockedText)},
  };
}

class AFailureOfAttestation : public DeviceAttestationHeaders,
                              public ::testing::WithParamInterface<Failure> {};

TEST_P(AFailureOfAttestation, IsLoggedAndLeavesOutWhatCouldNotBeMade) {
  GetParam().cause(simulated.attestation);
  addKestAuthenticationHeadersWithBody(simulated.platform, request, "body");

  EXPECT_THAT(standardLines(), ElementsAreArray(GetParam().standardLines));
  EXPECT_THAT(errorLines(), ElementsAreArray(GetParam().errorLines));
  EXPECT_EQ(signature().has_value(), GetParam().hasSignature);
  EXPECT_EQ(chainHeader().has_value(), GetParam().hasChain);
}

INSTANTIATE_TEST_SUITE_P(Table, AFailureOfAttestation, ::testing::ValuesIn(failures()),
                         [](const auto& parameter) {
                           std::string name = parameter.param.name;
                           std::replace(name.begin(), name.end(), ' ', '_');
                           return name;
                         });

TEST_F(DeviceAttestationHeaders, FallBackOnceWhenThePreferredKindIsMissing) {
  for (const int code : {-11, -4}) {
    SCOPED_TRACE(code);
    simulated.attestation.requests.clear();
    simulated.attestation.preferred = SimulatedDeviceAttestation::failed(code, 20);
    simulated.attestation.fallback.delay = 39;
    simulated.log.clear();
    request = {};
    addKestAuthenticationHeadersWithBody(simulated.platform, request, "body");

    ASSERT_THAT(simulated.attestation.requests, SizeIs(2));
    EXPECT_FALSE(simulated.attestation.requests[0].usesFallbackKind);
    EXPECT_TRUE(simulated.attestation.requests[1].usesFallbackKind);
    EXPECT_THAT(errorLines(), ElementsAre(fellBack(code)));
    EXPECT_TRUE(signature() && chainHeader());
  }
}

TEST_F(DeviceAttestationHeaders, AreNotTouchedByAnAnswerThatComesTooLate) {
  simulated.attestation.preferred = SimulatedDeviceAttestation::failed(-11, 70);
  simulated.attestation.fallback = SimulatedDeviceAttestation::failed(9, 20);
  addKestAuthenticationHeadersWithBody(simulated.platform, request, "body");
  EXPECT_EQ(simulated.clock.elapsed(), 60);
  simulated.queues.advance(100);
  EXPECT_THAT(errorLines(), ElementsAre(fellBack(-11), generationFailed(issueError(9))));
  EXPECT_THAT(request.headers.fields(), IsEmpty());
}

TEST_F(DeviceAttestationHeaders, LeaveALateAnswerWithTheManager) {
  simulated.attestation.preferred.delay = 70;
  KVRKestManager manager(simulated.platform);
  int answers = 0;
  EXPECT_FALSE(manager.generateKestCertficate([&](const auto&, const auto&, const auto&) { ++answers; }));
  EXPECT_FALSE(manager.privateKey());
  simulated.queues.advance(10);
  EXPECT_EQ(answers, 1);
  EXPECT_EQ(manager.privateKey(), simulated.attestation.key);
  EXPECT_EQ(manager.clientCertArray(), chain);
}

TEST_F(DeviceAttestationHeaders, CanBeMadeForASerialNumberAlone) {
  request.body = "the request's own";
  addKestAuthenticationHeadersWithSerialNumber(simulated.platform, request, "C39/\"1\"");
  EXPECT_THAT(simulated.attestation.key->messages, ElementsAre(R"({"serialNumber":"C39/\"1\""})"));
  EXPECT_EQ(request.body, "the request's own");
  EXPECT_TRUE(signature() && chainHeader());
}

TEST_F(DeviceAttestationHeaders, EscapeEverySlashOfTheChain) {
  const KVRKestManager manager(simulated.platform);
  const auto bytes = manager.certificatesEncodeToBase64(
      {std::string(30, '\xff'), "", std::string(30, '\xff')}, *std::make_unique<std::optional<Error>>());
  std::string slashes;
  for (int count = 0; count < 40; ++count) slashes += "\\/";
  EXPECT_EQ(inflated(decoded(bytes)), R"({"certs":[")" + slashes + R"(",")" + slashes + R"("]})");
}

TEST_F(DeviceAttestationHeaders, CompressOnlyWhatDoesNotGrow) {
  const KVRKestManager manager(simulated.platform);
  for (const std::string& data : {std::string(), std::string("abc"), certificate(3)}) {
    EXPECT_FALSE(manager._zlibCompressionForData(data)) << data.size();
  }
  EXPECT_EQ(inflated(*manager._zlibCompressionForData(std::string(60000, 'a'))), std::string(60000, 'a'));
}

TEST(ASerialHash, IsTheSHA256OfTheTextUpToItsFirstNUL) {
  EXPECT_EQ(sha256Hash("abc"), "ba7816bf8f01cfea414140de5dae2223b00361a396177a9cb410ff61f20015ad");
  EXPECT_EQ(sha256Hash(std::string_view("abc\0def", 7)), sha256Hash("abc"));
  EXPECT_EQ(sha256Hash(""), "e3b0c44298fc1c149afbf4c8996fb92427ae41e4649b934ca495991b7852b855");
}

TEST(Base64, IsPaddedAndOnOneLine) {
  const std::pair<std::string_view, const char*> cases[] = {
      {"", ""}, {"f", "Zg=="}, {"fo", "Zm8="}, {"foo", "Zm9v"}, {{"\xfb\xff\0", 3}, "+/8A"}};
  for (const auto& [bytes, text] : cases) EXPECT_EQ(base64Encoded(bytes), text);
  // Longer than what is encoded at once.
  const std::string large(7'000'001, 'x');
  EXPECT_EQ(decoded(base64Encoded(large)), large);
}

}  // namespace
}  // namespace kvr
