#include "conformance/FileWorld.h"
#include "local/keys/LocalDeviceAttestation.h"
#include "simulated/SimulatedDeviceProperties.h"

#include <openssl/pem.h>
#include <openssl/x509v3.h>

#include <future>

namespace kvr {
namespace {

namespace fs = std::filesystem;

constexpr const char* kLabel = "com.tarsil.kvragent.kestCertificates";

struct Answer {
  AttestedKeyRef key;
  std::optional<CertificateChain> chain;
  std::optional<Error> error;
};

openssl::Certificate certificateInDER(const std::string& bytes) {
  const auto* at = reinterpret_cast<const unsigned char*>(bytes.data());
  return openssl::adoptCertificate(d2i_X509(nullptr, &at, static_cast<long>(bytes.size())));
}

/// The result of verifying a leaf against an authority's PEM file with OpenSSL.
std::string verdictOn(const std::string& leaf, const fs::path& authority, Date now) {
  const openssl::StoreHandle trusted(X509_STORE_new());
  const openssl::StoreContextHandle context(X509_STORE_CTX_new());
  X509_STORE_load_file(trusted.get(), authority.c_str());
  const auto certificate = certificateInDER(leaf);
  X509_STORE_CTX_init(context.get(), trusted.get(), certificate.get(), nullptr);
  auto* const parameters = X509_STORE_CTX_get0_param(context.get());
  X509_VERIFY_PARAM_set_time(parameters, static_cast<std::time_t>(now.secondsSince1970));
  X509_VERIFY_PARAM_set_purpose(parameters, X509_PURPOSE_SSL_CLIENT);
  X509_VERIFY_PARAM_set_flags(parameters, X509_V_FLAG_X509_STRICT);
  X509_verify_cert(context.get());
  return X509_verify_cert_error_string(X509_STORE_CTX_get_error(context.get()));
}

bool isSignatureOf(const std::string& signature, const std::string& message, const std::string& leaf) {
  const auto certificate = certificateInDER(leaf);
  const openssl::DigestContextHandle context(EVP_MD_CTX_new());
  EVP_DigestVerifyInit(context.get(), nullptr, EVP_sha256(), nullptr, X509_get0_pubkey(certificate.get()));
  return EVP_DigestVerify(context.get(), reinterpret_cast<const unsigned char*>(signature.data()),
                          signature.size(), reinterpret_cast<const unsigned char*>(message.data()),
                          message.size()) == 1;
}

/// Files whose stamps are settled and depend on the contents only.
struct OldFiles : LocalFiles {
  using LocalFiles::LocalFiles;

  Result<std::optional<FileStamp>> stamp(const std::string& path) override {
    const auto found = LocalFiles::stamp(path);
    if (!found || !*found) return found;
    const auto content = contentOfFile(path);
    FileStamp stamp;
    stamp.size = std::hash<std::string>()(*content);
    stamp.settled = true;
    return std::optional(stamp);
  }
  Result<std::optional<FileContents>> read(const std::string& path, std::size_t limit) override {
    if (path.find("/Keys/") != std::string::npos) ++readings;
    return LocalFiles::read(path, limit);
  }

  int readings = 0;  ///< how often a key or certificate was read
};

struct AnAttestation : ::testing::Test {
  AnAttestation() {
    properties_.answers["SerialNumber"] = "C39SERIAL";
    properties_.answers["ProductType"] = "Phone14,2";
  }

  /// The objects of one process.
  struct Process {
    explicit Process(AnAttestation& test)
        : files(test.log_, test.home()),
          lists(files, test.clock_, test.log_),
          root(lists, test.log_, test.home() + "/device"),
          attestation(root, test.properties_, files, test.clock_, test.log_) {}

    std::future<Answer> ask(const AttestationOptions& options) {
      auto promise = std::make_shared<std::promise<Answer>>();
      attestation.issueClientCertificate(options, [promise](auto key, auto chain, auto error) {
        promise->set_value({std::move(key), std::move(chain), std::move(error)});
      });
      return promise->get_future();
    }

    OldFiles files;
    PropertyListFiles lists;
    DeviceRoot root;
    LocalDeviceAttestation attestation;
  };

  static AttestationOptions options(bool usesFallbackKind = false) {
    return {.label = kLabel,
            .accessGroup = "com.tarsil.kvragent",
            .usesFallbackKind = usesFallbackKind,
            .validity = 43200,
            .accessControl = nullptr,
            .identifierGroups = {std::string(DeviceAttestation::kDeviceIdentifiers),
                                 std::string(DeviceAttestation::kHardwareProperties)}};
  }
  /// Asks through a new `Process` and returns the answer.
  Answer issued(bool usesFallbackKind = false) { return Process(*this).ask(options(usesFallbackKind)).get(); }
  void expectGood(const Answer& answer) const {
    ASSERT_FALSE(answer.error) << describe(*answer.error);
    ASSERT_THAT(*answer.chain, SizeIs(2));
    const std::string body("a body\0with NUL", 15);
    EXPECT_TRUE(isSignatureOf(*answer.key->sign(body), body, answer.chain->front()));
    EXPECT_FALSE(isSignatureOf(*answer.key->sign(body), "another body", answer.chain->front()));
    EXPECT_EQ(verdictOn(answer.chain->front(), keys() / "authority.pem", clock_.now()), "ok");
  }
  std::string home() const { return directory_.path().string(); }
  fs::path keys() const { return fs::path(home()) / "Library/Keys" / kLabel; }
  std::string kept(const char* file) const { return *contentOfFile(keys() / file); }

  TemporaryDirectory directory_;
  SimulatedClock clock_;
  SimulatedLog log_;
  SimulatedDeviceProperties properties_;
};

TEST_F(AnAttestation, SignsWithAKeyThatTheLocalAuthorityCertifiesForTheDevice) {
  for (const bool usesFallbackKind : {false, true}) {
    const auto answer = issued(usesFallbackKind);
    expectGood(answer);
    const auto& leaf = answer.chain->front();
    EXPECT_EQ(verdictOn(leaf, keys() / "authority.pem", clock_.now() + 29 * kDay), "ok");
    EXPECT_NE(verdictOn(leaf, keys() / "authority.pem", clock_.now() + 31 * kDay), "ok");
    EXPECT_EQ(answer.chain->back(), *derOf(certificatesInPEM(kept("authority.pem")).front()));
    EXPECT_THAT(leaf, HasSubstr("Phone14,2"));
    // The SHA-256 of the serial number.
    EXPECT_THAT(leaf, HasSubstr("f4ba7148758c1fb5b89f69efee398edc03ab60cde388cf19c382dc080f4f8afc"));
    EXPECT_THAT(leaf, Not(HasSubstr("C39SERIAL")));
  }
}

TEST_F(AnAttestation, IsIssuedOnceAndAnsweredFromThereWhileItIsValid) {
  const auto first = issued();
  clock_.moveBy(-60);
  EXPECT_EQ(issued().chain, first.chain);
  clock_.moveBy(60 + 30 * kDay - 1);
  const auto last = issued();
  EXPECT_EQ(last.chain, first.chain);
  expectGood(last);
  EXPECT_NE(issued(true).chain, first.chain);
}

TEST_F(AnAttestation, IsIssuedAnewWhenWhatIsKeptIsNoGoodAndSaysSoOnceWhenItIsDamaged) {
  const auto fill = [&](const char* file, const std::string& content) { writeFile(keys() / file, content); };
  std::vector<std::tuple<std::string, std::function<void()>, bool>> cases = {
      {"another key", [&] { fill("preferred.key", kept("fallback.key")); }, true},
      {"another chain", [&] { fill("preferred.pem", kept("fallback.pem")); }, true},
      {"no chain but its own authority", [&] { fill("preferred.pem", kept("authority.pem")); }, true},
      {"another authority key", [&] { fill("authority.key", kept("preferred.key")); }, true},
      {"a leaf as authority",
       [&] {
         const auto chain = kept("preferred.pem");
         fill("authority.pem", chain.substr(0, chain.find("-----BEGIN", 1)));
         fill("authority.key", kept("preferred.key"));
       },
       true},
      {"far too large", [&] { fill("preferred.pem", std::string(1 << 20, '\n')); }, true},
      {"an expired one", [&] { clock_.moveBy(30 * kDay); }, false},
      {"one of the future", [&] { clock_.moveBy(-kDay); }, false},
      {"another device's", [&] { properties_.answers["SerialNumber"] = "C39OTHER"; }, false}};
  for (const char* file : {"authority.key", "authority.pem", "preferred.key", "preferred.pem"}) {
    cases.emplace_back(
        file, [=, this] { fs::remove(keys() / file); }, false);
  }

  Process process(*this);
  const auto ask = [&] { return process.ask(options()).get(); };
  for (const auto& [name, spoil, isDamage] : cases) {
    SCOPED_TRACE(name);
    ASSERT_FALSE(issued(true).error);
    const auto before = ask();
    EXPECT_EQ(ask().chain, before.chain);
    const int readings = process.files.readings;
    EXPECT_EQ(ask().chain, before.chain);
    EXPECT_EQ(process.files.readings, readings);
    log_.clear();
    spoil();
    const auto after = ask();
    expectGood(after);
    EXPECT_NE(after.chain, before.chain);
    EXPECT_EQ(issued().chain, after.chain);
    EXPECT_THAT(log_.texts(LogLevel::Error), SizeIs(isDamage ? 1 : 0));
  }
}

TEST_F(AnAttestation, DoesWhatTheDevicesFileSays) {
  const std::tuple<Dictionary, bool, std::int64_t, bool> cases[] = {
      {{{"Supported", false}}, false, 0, true},
      {{{"PreferredError", -11}}, false, -11, false},
      {{{"PreferredError", -11}}, true, 0, true},
      {{{"PreferredError", -4}, {"FallbackError", 9}}, true, 9, false},
      {{{"OmitChain", true}}, false, 0, false},
      {{}, false, 0, true}};
  for (const auto& [behaviour, usesFallbackKind, code, hasChain] : cases) {
    writeFile(home() + "/device/Attestation.plist", *writePropertyList(behaviour, PropertyListEncoding::XML));
    EXPECT_EQ(Process(*this).attestation.isSupported(), !behaviour.contains("Supported"));
    const auto answer = issued(usesFallbackKind);
    EXPECT_EQ(answer.error ? answer.error->code : 0, code) << describe(Value(behaviour));
    EXPECT_TRUE(!answer.error || answer.error->domain == DeviceAttestation::kErrorDomain);
    EXPECT_EQ(answer.chain.has_value(), hasChain) << describe(Value(behaviour));
    EXPECT_EQ(answer.key != nullptr, code == 0);
  }
}

TEST_F(AnAttestation, FailsAndKeepsEverythingWhenItsFilesCannotBeRead) {
  const auto before = issued();
  fs::rename(keys() / "authority.key", keys() / "kept");
  fs::create_directory(keys() / "authority.key");
  const auto answer = issued();
  ASSERT_TRUE(answer.error);
  EXPECT_EQ(answer.error->domain, "files");
  EXPECT_FALSE(answer.key);

  fs::remove(keys() / "authority.key");
  fs::rename(keys() / "kept", keys() / "authority.key");
  EXPECT_EQ(issued().chain, before.chain);
}

TEST_F(AnAttestation, IsTheSameForAllWhoAskAtOnceInTwoProcesses) {
  Process processes[] = {Process(*this), Process(*this)};
  std::vector<std::future<Answer>> asked;
  for (int caller = 0; caller < 64; ++caller) asked.push_back(processes[caller % 2].ask(options()));
  std::vector<CertificateChain> chains;
  for (auto& answer : asked) chains.push_back(answer.get().chain.value_or(CertificateChain{}));
  EXPECT_THAT(chains, Each(chains.front()));
  EXPECT_THAT(chains.front(), SizeIs(2));
  EXPECT_THAT(log_.texts(LogLevel::Error), IsEmpty());
}

}  // namespace
}  // namespace kvr
