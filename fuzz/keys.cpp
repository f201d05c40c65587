// The files of attested keys: the input replaces each in turn; the others are valid.
#include "Fuzz.h"
#include "local/keys/LocalKeyStore.h"
#include "simulated/SimulatedFiles.h"
#include "simulated/SimulatedLog.h"
#include "simulated/loop/SimulatedClock.h"

#include <openssl/objects.h>

#include <fstream>
#include <iterator>

namespace kvr::fuzz {
namespace {

openssl::Certificate certificateIn(const std::string& bytes) {
  const auto* at = reinterpret_cast<const unsigned char*>(bytes.data());
  return openssl::adoptCertificate(d2i_X509(nullptr, &at, static_cast<long>(bytes.size())));
}

struct Keys {
  Keys() {
    for (const auto* name : {"authority.key", "authority.pem", "preferred.key", "preferred.pem"}) {
      std::ifstream file(std::string(KVR_SOUND_KEYS "/") + name, std::ios::binary);
      sound.put(directory + name, std::string(std::istreambuf_iterator<char>(file), {}));
    }
    bool isChanged = false;
    sound.whenChanged([&isChanged](const std::string&, bool) { isChanged = true; });
    kept = *LocalKeyStore(sound, clock, log).credentialsFor(request);
    sound.whenChanged({});
    require(log.texts().empty() && !isChanged, "the sound files are sound");
  }

  SimulatedClock clock;
  SimulatedLog log;
  SimulatedFiles sound{clock};
  SimulatedFiles files{clock};
  const LocalKeyStore::Request request{
      .label = "label", .kind = "preferred", .subject = {{NID_commonName, "name"}}, .validity = 43200};
  const std::string directory = std::string(SimulatedFiles::kHomeDirectory) + "/Library/Keys/label/";
  AttestedCredentials kept;

  void runWith(const std::string& name, const std::string& bytes) {
    files.takeOver(sound);
    files.put(directory + name, bytes);
    log.clear();
    LocalKeyStore store(files, clock, log);
    const auto issued = store.credentialsFor(request);
    require(bool(issued), "there are credentials whatever is damaged", name);
    const auto authority = certificateIn(issued->issuer);
    require(verify(certificateIn(issued->leaf), authority, clock.now()) == Verdict::Good, "they are sound");
    const auto errors = log.texts(LogLevel::Error).size();
    // It may be a valid pair of another authority: then the leaf is reported.
    require(issued->leaf == kept.leaf ? errors == 0 : errors == 1, "one line, unless what was kept is good");
    const auto again = store.credentialsFor(request);
    require(again && again->leaf == issued->leaf, "what is made anew is kept");
    require(log.texts(LogLevel::Error).size() == errors, "and nothing more is reported");
  }
};

}  // namespace

void run(std::string_view input) {
  static Keys keys;
  const bool isKey = input.find("PRIVATE KEY") != std::string_view::npos;
  for (const auto* base : {"authority", "preferred"}) {
    keys.runWith(base + std::string(isKey ? ".key" : ".pem"), std::string(input));
  }
}

}  // namespace kvr::fuzz
