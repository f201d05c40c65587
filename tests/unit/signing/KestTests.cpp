#include "core/signing/KestHeaders.h"
#include "platform/text/Base64.h"
#include "platform/text/SHA256Hash.h"
#include "unit/SimulatedTest.h"

#include <random>

namespace kvr {
namespace {

constexpr const char* kBegin =
    "-[HTTPRequest(AccountHeaders) addKestAuthenticationHeadersWithBody:]: Initiating device authentication";
constexpr const char* kSupported = "-[KVRKestManager generateKestCertficate:]: isSupported: 1";
constexpr const char* kUnsupported = "-[KVRKestManager generateKestCertficate:]: isSupported: 0";
constexpr const char* kGenerated = "Kest certificate generation success: 1";
constexpr const char* kNotGenerated = "Kest certificate generation success: 0";

/// Bytes that resemble a certificate: always the same, and hardly compressible.
std::string certificate(unsigned seed) {
  std::mt19937 random(seed);
  std::string bytes(600, '\0');
  for (auto& byte : bytes) byte = static_cast<char>(random());
  return bytes;
}

struct DeviceAttestationHeaders : SimulatedTest {
  DeviceAttestationHeaders() {
    world.attestation.preferred.chain = chain;
    world.attestation.fallback.chain = chain;
  }

  std::optional<std::string> signature() const { return request.headers.value("X-Tarsil-Kest-S"); }
  std::optional<std::string> chainHeader() const { return request.headers.value("X-Tarsil-Kest"); }
  std::vector<std::string> errorLines() const { return world.log.texts(LogLevel::Error); }

  const CertificateChain chain = {certificate(1), certificate(2)};
  HTTPRequest request;
};

TEST_F(DeviceAttestationHeaders, CarryTheSignatureOfTheBodyAndTheChain) {
  request.body = std::string("{\"a\":\"\0\"}", 9);
  addKestAuthenticationHeadersWithBody(world.platform, request, request.body);

  EXPECT_THAT(world.attestation.key->messages, ElementsAre(request.body));
  EXPECT_EQ(signature(), base64Encode("signature"));
  ASSERT_TRUE(chainHeader());
  EXPECT_THAT(world.log.texts(LogLevel::Default),
              ElementsAre(kBegin, kSupported, kGenerated,
                          "-[KVRKestManager addKestAuthenticationHeadersToRequest:withBody:error:]: "
                          "signatureDataString: " +
                              *signature() + "\n certificateString: " + *chainHeader(),
                          "Device authentication successful"));
  EXPECT_THAT(errorLines(), IsEmpty());
}

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
      "with error: " +
      error);
  before.push_back("Device authentication failed with error: " + error);
  return before;
}

TEST_F(DeviceAttestationHeaders, AreLeftOutAndTheReasonLoggedWhenTheyCannotBeMade) {
  using Attestation = SimulatedDeviceAttestation;
  using Lines = std::vector<std::string>;
  enum Headers { kNone, kSignature, kChain };
  const auto expect = [&](Lines outcome, const Lines& errors, Headers headers,
                          const std::function<void(Attestation&)>& cause) {
    SCOPED_TRACE(::testing::PrintToString(errors));
    SimulatedPlatform fresh;
    fresh.attestation.preferred.chain = chain;
    fresh.attestation.fallback.chain = chain;
    cause(fresh.attestation);
    request = {};
    addKestAuthenticationHeadersWithBody(fresh.platform, request, "body");
    outcome.insert(outcome.begin(), kBegin);
    EXPECT_EQ(fresh.log.texts(LogLevel::Default), outcome);
    EXPECT_EQ(fresh.log.texts(LogLevel::Error), errors);
    EXPECT_EQ(signature().has_value(), headers == kSignature);
    EXPECT_EQ(chainHeader().has_value(), headers == kChain);
    fresh.queues.run();
    EXPECT_THAT(fresh.faults(), IsEmpty());
  };
  const Lines ungenerated = {kSupported, kNotGenerated};
  const std::string generate = "-[KVRKestManager generateKestCertficate:]: ";
  const Lines timedOut = {kSupported, generate + "Installation timed out after 60 seconds", kNotGenerated};
  const Lines generated = {kSupported, kGenerated};
  const Error locked{"keys", 5, "locked"};
  const std::string unableToSign = "Unable to sign data and encode with error: " + describe(locked);
  const auto missing = generate + "Failed to get reference key or cert!";
  const auto nullData = "-[KVRKestManager serializeCertificateChain:]: Found NULL attestation data!!";
  const auto tooLong = "Error Domain=zlib Code=0 \"the compressed form is longer than what it is made of\"";

  expect({kUnsupported, kNotGenerated}, {}, kNone, [](auto& a) { a.supported = false; });
  expect(ungenerated, {"Failed to create access control: " + describe(locked)}, kNone,
         [&](auto& a) { a.accessControlError = locked; });
  // The code means a missing certificate only in the domain of the attestation service.
  const Error elsewhere{"elsewhere", -11, "not issued"};
  expect(ungenerated, {generationFailed(describe(elsewhere))}, kNone,
         [&](auto& a) { a.preferred.error = elsewhere; });
  expect(ungenerated, {missing}, kNone, [](auto& a) { a.preferred.chain.reset(); });
  expect(ungenerated, {missing}, kNone, [](auto& a) { a.preferred.key.reset(); });
  expect(ungenerated, {fellBack(-11), generationFailed(issueError(3))}, kNone, [](auto& a) {
    a.preferred = Attestation::failed(-11);
    a.fallback = Attestation::failed(3);
  });
  expect(ungenerated, {fellBack(-4)}, kNone, [](auto& a) {
    a.preferred = Attestation::failed(-4);
    a.fallback.chain.reset();
  });
  expect(timedOut, {}, kNone, [](auto& a) { a.preferred.delay = 60.001; });
  // Both attempts share one time limit.
  expect(timedOut, {fellBack(-11)}, kNone, [](auto& a) {
    a.preferred = Attestation::failed(-11, 31);
    a.fallback.delay = 30;
  });
  expect(generated, headersFailed({unableToSign}, describe(locked)), kChain,
         [&](auto& a) { a.key->signature = locked; });
  expect(generated, headersFailed({nullData, "Unable to sign request"}, tooLong), kSignature,
         [](auto& a) { a.preferred.chain = CertificateChain{""}; });
  expect(generated, headersFailed({unableToSign, "Unable to sign request"}, describe(locked)), kNone,
         [&](auto& a) {
           a.key->signature = locked;
           a.preferred.chain = CertificateChain{};
         });
}

TEST_F(DeviceAttestationHeaders, AreNotTouchedByAnAnswerThatComesTooLate) {
  world.attestation.preferred = SimulatedDeviceAttestation::failed(-11, 70);
  world.attestation.fallback = SimulatedDeviceAttestation::failed(9, 20);
  addKestAuthenticationHeadersWithBody(world.platform, request, "body");
  EXPECT_EQ(world.clock.elapsed(), 60);
  world.queues.advance(100);
  EXPECT_THAT(errorLines(), ElementsAre(fellBack(-11), generationFailed(issueError(9))));
  EXPECT_THAT(request.headers.fields(), IsEmpty());
}

TEST_F(DeviceAttestationHeaders, CanBeMadeForASerialNumberAlone) {
  request.body = "the request's own";
  addKestAuthenticationHeadersWithSerialNumber(world.platform, request, "C39/\"1\"");
  EXPECT_THAT(world.attestation.key->messages, ElementsAre(R"({"serialNumber":"C39/\"1\""})"));
  EXPECT_EQ(request.body, "the request's own");
  EXPECT_TRUE(signature() && chainHeader());
}

TEST(ASerialHash, IsTheSHA256OfTheTextUpToItsFirstNUL) {
  EXPECT_EQ(sha256Hash("abc"), "ba7816bf8f01cfea414140de5dae2223b00361a396177a9cb410ff61f20015ad");
  EXPECT_EQ(sha256Hash(std::string_view("abc\0def", 7)), sha256Hash("abc"));
}

TEST(Base64, IsOnOneLineHoweverLong) {
  EXPECT_EQ(base64Encode(std::string_view("\xfb\xff\0\xfb", 4)), "+/8A+w==");
  const std::string large(7'000'001, 'x');
  const auto decoded = base64Decode(base64Encode(large));
  EXPECT_TRUE(decoded && std::string(decoded->begin(), decoded->end()) == large);
}

}  // namespace
}  // namespace kvr
