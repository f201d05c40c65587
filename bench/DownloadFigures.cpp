// The cost of a download without the network: the agent's own classes on the local platform, in this process.

#include "CoverageAnswer.h"
#include "DownloadByHand.h"
#include "Figures.h"
#include "Measurement.h"
#include "Programs.h"
#include "core/agent/Activities.h"
#include "core/agent/Configuration.h"
#include "core/outreach/WarrantyDownloads.h"
#include "core/signing/AccountHeaders.h"
#include "core/signing/KestHeaders.h"
#include "core/warranty/WarrantyKeys.h"
#include "local/LocalPlatform.h"
#include "local/loop/EventLoop.h"

#include <fcntl.h>
#include <httplib.h>
#include <unistd.h>

#include <chrono>
#include <cstdlib>
#include <future>
#include <stdexcept>
#include <thread>

namespace kvr::bench {
namespace {

/// Redirects this process's standard error to /dev/null, because the platform's log goes there.
class Silence {
 public:
  Silence() : kept_(::dup(STDERR_FILENO)) { redirect(::open("/dev/null", O_WRONLY | O_CLOEXEC)); }
  ~Silence() { redirect(kept_); }
  Silence(const Silence&) = delete;
  Silence& operator=(const Silence&) = delete;

 private:
  static void redirect(int descriptor) {
    ::dup2(descriptor, STDERR_FILENO);
    ::close(descriptor);
  }
  const int kept_;
};

/// A session that answers every request at once and records when it did.
class Canned : public HTTP, public HTTPSession {
 public:
  explicit Canned(WorkQueues& queues) : queues_(queues) {}
  HTTPSession& sharedSession() override { return *this; }
  std::shared_ptr<HTTPSession> newUncachedSession() override {
    return {this, [](HTTPSession*) {}};
  }
  void send(HTTPRequest, Reply reply) override {
    queues_.concurrentQueue(Priority::Default)->async([this, reply] {
      HTTPResponse response{200, answer_, std::nullopt};
      answered_ = Clock::now();
      reply(std::move(response));
    });
  }
  Clock::time_point answered() const { return answered_; }

 private:
  WorkQueues& queues_;
  const std::string answer_ = coverageAnswer();
  Clock::time_point answered_;  ///< read once the download has completed
};

/// The local platform with the fixture's device, in this process.
class InProcess {
 public:
  InProcess() { kvr_registerDefaults(local_->preferences); }
  ~InProcess() { local_->end(10); }
  InProcess(const InProcess&) = delete;
  InProcess& operator=(const InProcess&) = delete;
  LocalPlatform& local() { return *local_; }
  const Programs& programs() const { return programs_; }

 private:
  std::unique_ptr<LocalPlatform> build() {
    ::setenv("HOME", programs_.world.home().c_str(), 1);
    ::setenv("KVR_DEVICE_ROOT", (programs_.world.directory / "device").c_str(), 1);
    return std::make_unique<LocalPlatform>(loop_, LocalLog::fromEnvironment(), [] {});
  }

  const Silence silence_;
  const Programs programs_;
  EventLoop loop_;
  const std::unique_ptr<LocalPlatform> local_ = build();
};

/// Downloads are never back to back in practice; after this pause, files count as settled again.
void pause() { std::this_thread::sleep_for(std::chrono::milliseconds(60)); }

/// Seconds from the answer's arrival until the download has completed.
double stored(Platform& platform, const Canned& canned) {
  std::promise<bool> done;
  newWarrantyDownloader(platform, kPreferencesBundleID)
      ->_downloadWarrantyForSerialNumber(
          AgentWorld::kFirstWatch,
          DownloadCompletion(platform.log, "bench",
                             [&done](bool succeeded, const KVRWarrantyRef&) { done.set_value(succeeded); }));
  if (!done.get_future().get()) throw std::runtime_error("nothing was downloaded");
  return std::chrono::duration<double>(Clock::now() - canned.answered()).count();
}

double medianOf(int runs, const std::function<double()>& once) {
  std::vector<double> times;
  times.reserve(static_cast<std::size_t>(runs));
  for (int i = 0; i < runs; ++i) times.push_back(once());
  return quantile(times, 0.5);
}

}  // namespace

void store() {
  constexpr int kRuns = 10;
  InProcess process;
  Platform& platform = process.local().platform;
  Canned canned(platform.queues);
  Platform cannedPlatform{
      .log = platform.log,
      .clock = platform.clock,
      .queues = platform.queues,
      .files = platform.files,
      .propertyLists = platform.propertyLists,
      .preferences = platform.preferences,
      .locale = platform.locale,
      .random = platform.random,
      .http = canned,
      .deviceProperties = platform.deviceProperties,
      .featureFlags = platform.featureFlags,
      .pairedDevices = platform.pairedDevices,
      .accounts = platform.accounts,
      .accountSession = platform.accountSession,
      .attestation = platform.attestation,
      .services = platform.services,
      .processes = platform.processes,
      .activities = platform.activities,
      .followUps = platform.followUps,
      .carriers = platform.carriers,
      .notifications = platform.notifications,
      .observers = platform.observers,
      .cleanExit = platform.cleanExit,
      .applications = platform.applications,
      .store = platform.store,
      .stringTables = platform.stringTables,
      .mainBundleIdentifier = platform.mainBundleIdentifier,
  };
  registerActivities(cannedPlatform);
  const std::string answer = coverageAnswer();
  const std::string path = (process.programs().world.home() / "by-hand.plist").string();
  const auto series = inTurns(
      [&] {
        return medianOf(kRuns, [&] {
          pause();
          return stored(cannedPlatform, canned);
        });
      },
      [&] {
        return medianOf(kRuns, [&] {
          pause();
          return secondsOf([&] { replaceByHand(path, propertyListByHand(answer)); });
        });
      });
  printRow(
      {"response to durable cache and metadata (parse, encode, one durable replace)", "≤ 1.5", "ms", 1e3, 2},
      series);
}

void request() {
  constexpr int kRuns = 100;
  InProcess process;
  Platform& platform = process.local().platform;
  HTTPRequest built;
  const auto build = [&] {
    HTTPRequest request;
    kvr_setCoverageRequestBodyWithSerialNumber(platform, request, AgentWorld::kPhone);
    addKestAuthenticationHeadersWithBody(platform, request, request.body);
    built = std::move(request);
  };
  build();  // creates the key
  pause();
  if (!built.headers.value("X-Tarsil-Kest")) throw std::runtime_error("the request was not attested");
  const HeldKey key(
      (process.programs().world.home() / "Library/Keys/com.tarsil.kvragent.kestCertificates").string());
  const auto median = [&](const std::function<void()>& work) {
    return medianOf(kRuns, [&] { return secondsOf(work); });
  };
  printRow(
      {"request with attestation headers from a held key (SHA-256, ECDSA, deflate, base64)", "≤ 1.5", "µs",
       1e6, 0},
      inTurns([&] { return median(build); }, [&] { return median([&] { attestByHand(key, built.body); }); }));
}

void refresh() {
  constexpr int kWatches = 50;
  Programs programs;
  std::vector<std::string> serialNumbers;
  serialNumbers.reserve(kWatches);
  for (int i = 0; i < kWatches; ++i) serialNumbers.push_back("SNWATCH" + std::to_string(100'000 + i));
  programs.world.pair(serialNumbers);
  programs.startAgent();
  programs.fillCache();
  programs.world.misbehave(R"([{"late":0.1}],"asset":[{"late":0.1}])");
  const RawBusClient client = programs.newClient();
  const std::string url = programs.world.preferences()["ServerVersionURL"].string();
  const auto path = url.find('/', url.find("://") + 3);
  httplib::Client bare(url.substr(0, path));
  bare.set_keep_alive(true);
  printRow({"refresh of 1 + 50 devices from a service that takes 100 ms (one exchange)", "≤ 3", "ms", 1e3, 0},
           inTurns([&] { return secondsOf([&] { AgentWorld::allInfos(client, AgentWorld::Refresh); }); },
                   [&] {
                     return secondsOf([&] {
                       const auto answer = bare.Get(url.substr(path));
                       if (!answer || answer->status != 200) throw std::runtime_error("no answer");
                     });
                   }));
}

}  // namespace kvr::bench
