// The clients' view: calls of the agent compared with calls of the bare service, by one client on one bus.

#include "CoverageAnswer.h"
#include "Figures.h"
#include "Measurement.h"
#include "Programs.h"
#include "core/warranty/CacheMetadata.h"
#include "core/warranty/WarrantyKeys.h"
#include "platform/codec/JSON.h"
#include "platform/codec/PropertyList.h"
#include "platform/text/SHA256Hash.h"

#include <systemd/sd-bus.h>

#include <chrono>
#include <stdexcept>
#include <thread>

namespace kvr::bench {
namespace {

using MakeCall = std::function<BusMessageRef(const RawBusClient&)>;

const MakeCall kAgentCall = [](const RawBusClient& client) { return infoCall(client); };
const MakeCall kBareCall = bareInfoCall;

Value infoFrom(const RawBusClient& client, const MakeCall& make) {
  return client.value("a{sv}", {answerTo(client, make(client)), {}, {}});
}

/// Starts the agent with a filled cache and a bare service with the same reply.
void startBoth(Programs& programs) {
  programs.startAgent();
  programs.fillCache();
  const RawBusClient client = programs.newClient();
  const Value info = infoFrom(client, kAgentCall);
  programs.startBare(info);
  if (infoFrom(client, kBareCall) != info)
    throw std::runtime_error("the bare service replies something else");
}

/// The median and the 99th percentile of single calls, in seconds.
std::vector<double> singleCalls(const RawBusClient& client, const MakeCall& make) {
  constexpr int kCalls = 1000;
  std::vector<double> times;
  times.reserve(kCalls);
  for (int i = 0; i < kCalls; ++i) {
    times.push_back(secondsOf([&] { answerTo(client, make(client)); }));
  }
  return {quantile(times, 0.5), quantile(times, 0.99)};
}

/// Keeps a number of calls in flight until enough have been answered.
class Flight {
 public:
  Flight(const RawBusClient& client, const MakeCall& make) : client_(client), make_(make) {}

  double callsASecond() {
    constexpr int kInFlight = 32;
    constexpr int kCalls = 3000;
    left_ = kCalls;
    const double seconds = secondsOf([this] {
      for (int i = 0; i < kInFlight; ++i) send();
      while (open_ > 0) {
        if (sd_bus_process(client_.bus(), nullptr) == 0) sd_bus_wait(client_.bus(), UINT64_MAX);
      }
    });
    return kCalls / seconds;
  }

 private:
  void send() {
    --left_;
    ++open_;
    const BusMessageRef call = make_(client_);
    const auto answered = [](sd_bus_message* reply, void* context, sd_bus_error*) {
      auto& flight = *static_cast<Flight*>(context);
      if (sd_bus_message_is_method_error(reply, nullptr)) std::terminate();
      --flight.open_;
      if (flight.left_ > 0) flight.send();
      return 0;
    };
    if (sd_bus_call_async(client_.bus(), nullptr, call.get(), answered, this, 0) < 0) std::terminate();
  }

  const RawBusClient& client_;
  const MakeCall& make_;
  int left_ = 0;
  int open_ = 0;
};

/// The median time for a new client to connect and make one call, in seconds.
double firstCalls(const Programs& programs, const MakeCall& make) {
  constexpr int kClients = 40;
  std::vector<double> times;
  times.reserve(kClients);
  for (int i = 0; i < kClients; ++i) {
    times.push_back(secondsOf([&] {
      const RawBusClient client = programs.newClient();
      answerTo(client, make(client));
    }));
  }
  return quantile(times, 0.5);
}

/// Writes a cached warranty for each watch, as a download would.
void writeCaches(const Programs& programs, const std::vector<std::string>& serialNumbers) {
  const Value warranty = *readJSON(coverageAnswer());
  const std::string bytes = *writePropertyList(warranty, PropertyListEncoding::XML);
  Value::Dictionary preferences = programs.world.preferences().dictionary();
  for (const auto& serialNumber : serialNumbers) {
    programs.world.directory.write(
        "home/Library/Application Support/com.tarsil.Kavrel/" + sha256Hash(serialNumber) + "_Warranty.plist",
        bytes);
    const CacheMetadata metadata(serialNumber);
    preferences.insert_or_assign(metadata.lastUpdatedDateKey, Date{1'790'000'000});
    preferences.insert_or_assign(metadata.localeKey, "en_US");
    preferences.insert_or_assign(metadata.versionKey, kCacheFormatVersion);
  }
  programs.world.directory.write("home/Library/Preferences/com.tarsil.kvragent.plist",
                                 *writePropertyList(preferences, PropertyListEncoding::Binary));
}

}  // namespace

void lookUp() {
  Programs programs;
  startBoth(programs);
  const RawBusClient client = programs.newClient();
  const auto series = inTurns(
      2, [&] { return singleCalls(client, kAgentCall); }, [&] { return singleCalls(client, kBareCall); });
  printRow({"cached look-up over the bus, p50", "≤ 1.2", "µs", 1e6, 0}, series[0]);
  printRow({"cached look-up over the bus, p99", "≤ 1.4", "µs", 1e6, 0}, series[1]);
}

void manyInFlight() {
  Programs programs;
  startBoth(programs);
  const RawBusClient client = programs.newClient();
  printRow({"the same, 32 in flight, calls a second", "≥ 0.8", "", 1, 0},
           inTurns([&] { return Flight(client, kAgentCall).callsASecond(); },
                   [&] { return Flight(client, kBareCall).callsASecond(); }));
}

void firstCall() {
  Programs programs;
  startBoth(programs);
  printRow({"connect and first call of a new client (bare: an empty call)", "≤ 2.0", "µs", 1e6, 0},
           inTurns([&] { return firstCalls(programs, kAgentCall); },
                   [&] { return firstCalls(programs, pingCall); }));
}

void allInfos() {
  double before = 0;
  std::size_t watchesBefore = 0;
  for (const std::size_t watches : {1U, 10U, 100U, 1000U}) {
    Programs programs;
    std::vector<std::string> serialNumbers;
    for (std::size_t i = 0; i < watches; ++i)
      serialNumbers.push_back("SNWATCH" + std::to_string(100'000 + i));
    programs.world.pair(serialNumbers);
    serialNumbers.emplace_back(AgentWorld::kPhone);
    writeCaches(programs, serialNumbers);
    programs.startAgent();
    // A file that changed a moment ago is parsed at every read.
    std::this_thread::sleep_for(std::chrono::milliseconds(100));
    const RawBusClient client = programs.newClient();
    const Value infos = AgentWorld::allInfos(client, AgentWorld::CacheOnly);
    if (infos.array().size() != watches + 1 || AgentWorld::warrantyIn(infos.array().back()).isNull()) {
      throw std::runtime_error("the cache does not answer for every watch");
    }
    Value::Dictionary tree;
    for (std::size_t i = 0; i <= watches; ++i) tree.emplace(std::to_string(i), infos.array()[i]);
    programs.startBare(tree);
    const auto series =
        inTurns([&] { return secondsOf([&] { answerTo(client, allInfosCall(client)); }); },
                [&] { return secondsOf([&] { answerTo(client, bareAllInfosCall(client)); }); });
    const double median = quantile(series.agent, 0.5);
    const double slope = (median - before) * 1e6 / static_cast<double>(watches - watchesBefore);
    const std::string goal =
        watchesBefore == 0 ? "linear" : "linear; " + number(slope, 0) + " µs a watch more";
    printRow({"all infos from the cache, " + std::to_string(watches) + (watches == 1 ? " watch" : " watches"),
              goal, "ms", 1e3, 2},
             series);
    before = median;
    watchesBefore = watches;
  }
}

}  // namespace kvr::bench
