#include "platform/PropertyList.h"
#include "platform/local/LocalDeviceAttestation.h"
#include "platform/local/LocalFiles.h"
#include "platform/simulated/SimulatedClock.h"
#include "platform/simulated/SimulatedDeviceProperties.h"
#include "platform/simulated/SimulatedLog.h"

#include <gmock/gmock.h>
#include <openssl/pem.h>
#include <openssl/x509v3.h>

#include <filesystem>
#include <fstream>
#include <future>
#include <iterator>

namespace kvr {
namespace {

namespace fs = std::filesystem;
using ::testing::Each;
using ::testing::IsEmpty;
using ::testing::SizeIs;

constexpr double kDay = 24 * 60 * 60;
constexpr const char* kLabel = "com.tarsil.kvragent.kestCertificates";

struct Answer {
  AttestedKeyRef key;
  std::optional<CertificateChain> chain;
  std::optional<Error> error;
};

std::string contentOf(const fs::path& path) {
  std::ifstream file(path, std::ios::binary);
  return {std::istreambuf_iterator<char>(file), {}};
}

void write(const fs::path& path, const std::string& content) {
  std::ofstream(path, std::ios::binary | std::ios::trunc) << content;
}

openssl::Certificate certificateInDER(const std::string& bytes) {
  const auto* at = reinterpret_cast<const unsigned char*>(bytes.data());
  return openssl::adoptCertificate(d2i_X509(nullptr, &at, static_cast<long>(bytes.size())));
}

/// What OpenSSL's verifier says of a leaf against an authority's PEM file.
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

class AnAttestation : public ::testing::Test {
 protected:
  AnAttestation() {
    std::string pattern = (fs::temp_directory_path() / "kvr-attestation-XXXXXX").string();
    home_ = mkdtemp(pattern.data());
    fs::create_directory(root_ = home_ / "device");
    properties_.answers["SerialNumber"] = "C39SERIAL";
    properties_.answers["ProductType"] = "Phone14,2";
  }
  ~AnAttestation() override { fs::remove_all(home_); }

  /// One process's view of the machine.
  struct Process {
    explicit Process(AnAttestation& test)
        : files(test.log_, test.home_.string()),
          lists(files, test.clock_, test.log_),
          root(lists, test.log_, test.root_.string()),
          attestation(root, test.properties_, files, test.clock_, test.log_) {}

    std::future<Answer> ask(const AttestationOptions& options) {
      auto promise = std::make_shared<std::promise<Answer>>();
      attestation.issueClientCertificate(options, [promise](auto key, auto chain, auto error) {
        promise->set_value({std::move(key), std::move(chain), std::move(error)});
      });
      return promise->get_future();
    }

    LocalFiles files;
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

  void behave(const Value::Dictionary& behaviour) {
    write(root_ / "Attestation.plist", *writePropertyList(behaviour, PropertyListEncoding::Binary));
  }

  fs::path keys() const { return home_ / "Library/Keys" / kLabel; }

  fs::path home_;
  fs::path root_;
  SimulatedClock clock_;
  SimulatedLog log_;
  SimulatedDeviceProperties properties_;
};

TEST_F(AnAttestation, SignsWithAKeyThatTheLocalAuthorityCertifies) {
  for (const bool usesFallbackKind : {false, true}) {
    SCOPED_TRACE(usesFallbackKind);
    const auto answer = Process(*this).ask(options(usesFallbackKind)).get();
    ASSERT_FALSE(answer.error) << describe(*answer.error);
    ASSERT_THAT(*answer.chain, SizeIs(2));
    EXPECT_EQ(verdictOn((*answer.chain)[0], keys() / "authority.pem", clock_.now()), "ok");
    EXPECT_EQ(verdictOn((*answer.chain)[0], keys() / "authority.pem", clock_.now() + 29 * kDay), "ok");
    EXPECT_NE(verdictOn((*answer.chain)[0], keys() / "authority.pem", clock_.now() + 31 * kDay), "ok");
    EXPECT_EQ((*answer.chain)[1], *derOf(certificatesInPEM(contentOf(keys() / "authority.pem")).front()));

    const auto signature = answer.key->sign(std::string("a body\0with NUL", 15));
    ASSERT_TRUE(signature);
    EXPECT_TRUE(isSignatureOf(*signature, std::string("a body\0with NUL", 15), (*answer.chain)[0]));
    EXPECT_FALSE(isSignatureOf(*signature, "another body", (*answer.chain)[0]));
  }
}

TEST_F(AnAttestation, NamesTheDeviceWithoutItsSerialNumber) {
  const auto answer = Process(*this).ask(options()).get();
  const auto& leaf = answer.chain->front();
  EXPECT_THAT(leaf, ::testing::HasSubstr("Phone14,2"));
  // The SHA-256 of the serial number.
  EXPECT_THAT(leaf, ::testing::HasSubstr("f4ba7148758c1fb5b89f69efee398edc03ab60cde388cf19c382dc080f4f8afc"));
  EXPECT_THAT(leaf, ::testing::Not(::testing::HasSubstr("C39SERIAL")));
}

TEST_F(AnAttestation, IsKeptForTheUserAlone) {
  ASSERT_FALSE(Process(*this).ask(options()).get().error);
  EXPECT_EQ(fs::status(keys()).permissions(), fs::perms::owner_all);
  std::vector<std::string> names;
  for (const auto& entry : fs::directory_iterator(keys())) {
    names.push_back(entry.path().filename());
    EXPECT_EQ(entry.status().permissions(), fs::perms::owner_read | fs::perms::owner_write) << entry;
  }
  EXPECT_THAT(names, ::testing::UnorderedElementsAre("authority.key", "authority.pem", "preferred.key",
                                                     "preferred.pem"));
}

TEST_F(AnAttestation, IsIssuedOnceAndAnsweredFromThereWhileItIsValid) {
  const auto first = Process(*this).ask(options()).get();
  clock_.moveBy(-60);
  EXPECT_EQ(Process(*this).ask(options()).get().chain, first.chain);
  clock_.moveBy(60 + 30 * kDay - 1);
  const auto last = Process(*this).ask(options()).get();
  EXPECT_EQ(last.chain, first.chain);
  EXPECT_TRUE(isSignatureOf(*last.key->sign("body"), "body", first.chain->front()));
  EXPECT_NE(Process(*this).ask(options(true)).get().chain, first.chain);
}

struct Spoiling {
  const char* name;
  std::function<void(const fs::path& keys)> spoil;
  bool isDamage;
};

TEST_F(AnAttestation, IsIssuedAnewWhenWhatIsKeptIsNoGoodAndSaysSoOnceWhenItIsDamaged) {
  const auto copyOver = [](const char* from, const char* to) {
    return [=](const fs::path& keys) {
      fs::copy_file(keys / from, keys / to, fs::copy_options::overwrite_existing);
    };
  };
  const auto fill = [](const char* file, const std::string& content) {
    return [=](const fs::path& keys) { write(keys / file, content); };
  };
  std::vector<Spoiling> cases = {
      {"another key", copyOver("fallback.key", "preferred.key"), true},
      {"another chain", copyOver("fallback.pem", "preferred.pem"), true},
      {"no chain but its own authority", copyOver("authority.pem", "preferred.pem"), true},
      {"another authority key", copyOver("preferred.key", "authority.key"), true},
      {"a leaf as authority",
       [](const fs::path& keys) {
         const auto chain = contentOf(keys / "preferred.pem");
         write(keys / "authority.pem", chain.substr(0, chain.find("-----BEGIN", 1)));
         fs::copy_file(keys / "preferred.key", keys / "authority.key", fs::copy_options::overwrite_existing);
       },
       true},
      {"far too large", fill("preferred.pem", std::string(1 << 20, '\n')), true},
      {"an expired one", [this](const fs::path&) { clock_.moveBy(30 * kDay); }, false},
      {"one of the future", [this](const fs::path&) { clock_.moveBy(-kDay); }, false},
      {"another device's", [this](const fs::path&) { properties_.answers["SerialNumber"] = "C39OTHER"; },
       false},
  };
  for (const char* file : {"authority.key", "authority.pem", "preferred.key", "preferred.pem"}) {
    cases.push_back({file, fill(file, "rubbish"), true});
    cases.push_back({file, fill(file, ""), true});
    cases.push_back(
        {file, [file](const fs::path& keys) { write(keys / file, contentOf(keys / file).substr(0, 100)); },
         true});
    cases.push_back({file, [file](const fs::path& keys) { fs::remove(keys / file); }, false});
  }

  for (const auto& spoiling : cases) {
    SCOPED_TRACE(spoiling.name);
    ASSERT_FALSE(Process(*this).ask(options(true)).get().error);
    const auto before = Process(*this).ask(options()).get();
    log_.clear();
    spoiling.spoil(keys());

    Process process(*this);
    const auto after = process.ask(options()).get();
    ASSERT_FALSE(after.error) << describe(*after.error);
    EXPECT_NE(after.chain, before.chain);
    EXPECT_EQ(process.ask(options()).get().chain, after.chain);
    EXPECT_EQ(verdictOn(after.chain->front(), keys() / "authority.pem", clock_.now()), "ok");
    EXPECT_TRUE(isSignatureOf(*after.key->sign("body"), "body", after.chain->front()));
    EXPECT_THAT(log_.texts(LogLevel::Error), SizeIs(spoiling.isDamage ? 1 : 0));
  }
}

TEST_F(AnAttestation, FailsAndKeepsEverythingWhenItsFilesCannotBeRead) {
  const auto before = Process(*this).ask(options()).get();
  fs::rename(keys() / "authority.key", keys() / "kept");
  fs::create_directory(keys() / "authority.key");
  const auto answer = Process(*this).ask(options()).get();
  ASSERT_TRUE(answer.error);
  EXPECT_EQ(answer.error->domain, "files");
  EXPECT_FALSE(answer.key);

  fs::remove(keys() / "authority.key");
  fs::rename(keys() / "kept", keys() / "authority.key");
  EXPECT_EQ(Process(*this).ask(options()).get().chain, before.chain);
}

TEST_F(AnAttestation, RefusesALabelThatLeadsElsewhere) {
  for (const char* label : {"", "..", "../../Preferences", "/tmp/keys"}) {
    auto strange = options();
    strange.label = label;
    EXPECT_TRUE(Process(*this).ask(strange).get().error) << label;
  }
  EXPECT_FALSE(fs::exists(home_ / "Library"));
}

TEST_F(AnAttestation, BehavesAsTheDeviceSays) {
  const Error noPreferred{std::string(DeviceAttestation::kErrorDomain), -11,
                          "the device has no certificate of this kind"};
  Process process(*this);
  EXPECT_TRUE(process.attestation.isSupported());
  behave({{"Supported", false}});
  EXPECT_FALSE(process.attestation.isSupported());
  behave({{"Supported", true}, {"PreferredError", -11}, {"Delay", 0.001}});
  EXPECT_TRUE(process.attestation.isSupported());
  EXPECT_EQ(process.ask(options()).get().error, noPreferred);
  EXPECT_FALSE(process.ask(options(true)).get().error);
  behave({{"FallbackError", 7}});
  EXPECT_FALSE(process.ask(options()).get().error);
  EXPECT_EQ(process.ask(options(true)).get().error->code, 7);

  behave({{"OmitChain", true}});
  const auto bare = process.ask(options()).get();
  EXPECT_TRUE(bare.key);
  EXPECT_FALSE(bare.chain);
  behave({});
  auto leafOnly = options();
  leafOnly.includesIssuer = false;
  EXPECT_THAT(*process.ask(leafOnly).get().chain, SizeIs(1));
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

TEST_F(AnAttestation, FailsWhenTheServiceEndsBeforeItsDelay) {
  behave({{"Delay", 1e6}});
  std::future<Answer> asked;
  {
    Process process(*this);
    asked = process.ask(options());
  }
  EXPECT_TRUE(asked.get().error);
}

}  // namespace
}  // namespace kvr
