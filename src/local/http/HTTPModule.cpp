#include "local/http/Exchange.h"
#include "local/http/HTTPTransfers.h"

#include <curl/curl.h>
#include <malloc.h>
#include <pthread.h>

#include <condition_variable>
#include <csignal>
#include <map>
#include <mutex>
#include <set>
#include <thread>

namespace kvr {
namespace http_module {
namespace {

using std::chrono::milliseconds;

constexpr long kConnectionsPerHost = 64;
/// Connections to a host after a service has refused some.
constexpr long kFewConnections = 6;
constexpr long kIdleConnections = kConnectionsPerHost;
/// When no transfer has run for this long, connections are closed and free memory is given back.
constexpr std::chrono::seconds kIdleTime{5};
/// The longest wait while a transfer is under way: if libcurl forgets one, this finds it again.
constexpr milliseconds kLongestWait{1000};
constexpr char kEnding[] = "the process is ending";

/// Carries out many exchanges on one thread, which sleeps while nothing is under way.
class CurlTransfers : public HTTPTransfers {
 public:
  CurlTransfers();
  ~CurlTransfers() override;
  CurlTransfers(const CurlTransfers&) = delete;
  CurlTransfers& operator=(const CurlTransfers&) = delete;

  void start(HTTPRequest request, Done done) override;
  void beginEnding() override;

 private:
  using ExchangeRef = std::unique_ptr<Exchange>;

  /// Null when memory is short.
  static MultiHandle newMultiHandle();
  void run() noexcept;
  /// The exchanges that were added meanwhile; waits for one if none is under way. Nothing when ending.
  std::optional<std::vector<ExchangeRef>> nextExchanges();
  void begin(ExchangeRef exchange);
  /// Advances all transfers as far as possible, then waits until there is more to do.
  void step();
  void collectFinished();
  bool yields(Exchange& exchange, CURLcode code);
  void expire();
  ExchangeRef take(Exchange& exchange);
  void failAll(CURLcode code, const char* text);

  MultiHandle multi_ = newMultiHandle();  ///< replaced by the thread, with the mutex held

  std::mutex mutex_;  ///< guards what follows
  std::condition_variable changed_;
  std::vector<ExchangeRef> incoming_;
  bool ending_ = false;

  // Used on the thread only.
  std::map<Exchange*, ExchangeRef> underWay_;
  std::set<std::pair<Clock::time_point, Exchange*>> deadlines_;
  bool hasChanged_ = false;  ///< a transfer began or ended since the last pass
  bool wereMany_ = false;    ///< since the last idle time, more exchanges than `kFewConnections` ran at once
  std::thread thread_;
};

MultiHandle CurlTransfers::newMultiHandle() {
  MultiHandle multi(curl_multi_init());
  if (!multi) return nullptr;
  curl_multi_setopt(multi.get(), CURLMOPT_MAX_HOST_CONNECTIONS, kConnectionsPerHost);
  curl_multi_setopt(multi.get(), CURLMOPT_MAXCONNECTS, kIdleConnections);
  curl_multi_setopt(multi.get(), CURLMOPT_PIPELINING, static_cast<long>(CURLPIPE_NOTHING));
  return multi;
}

CurlTransfers::CurlTransfers() {
  if (!multi_) throw std::bad_alloc();
  // The thread, and those it starts to resolve names, inherit the signal mask: signals go to the main thread,
  // and a broken connection raises none here.
  sigset_t all;
  sigset_t before;
  sigfillset(&all);
  pthread_sigmask(SIG_SETMASK, &all, &before);
  try {
    thread_ = std::thread([this] { run(); });
  } catch (...) {
    pthread_sigmask(SIG_SETMASK, &before, nullptr);
    throw;
  }
  pthread_sigmask(SIG_SETMASK, &before, nullptr);
}

CurlTransfers::~CurlTransfers() {
  CurlTransfers::beginEnding();
  thread_.join();
}

void CurlTransfers::start(HTTPRequest request, Done done) {
  auto exchange = std::make_unique<Exchange>(std::move(request), std::move(done));
  std::unique_lock lock(mutex_);
  if (ending_) {
    lock.unlock();
    return exchange->fail(CURLE_ABORTED_BY_CALLBACK, kEnding);
  }
  incoming_.push_back(std::move(exchange));
  curl_multi_wakeup(multi_.get());
  lock.unlock();
  changed_.notify_one();
}

void CurlTransfers::beginEnding() {
  const std::lock_guard lock(mutex_);
  ending_ = true;
  changed_.notify_one();
  curl_multi_wakeup(multi_.get());
}

void CurlTransfers::run() noexcept {
  while (auto exchanges = nextExchanges()) {
    try {
      for (auto& exchange : *exchanges) begin(std::move(exchange));
      step();
    } catch (const std::exception& error) {
      failAll(CURLE_FAILED_INIT, error.what());
    }
  }
  failAll(CURLE_ABORTED_BY_CALLBACK, kEnding);
  std::unique_lock lock(mutex_);
  const auto late = std::exchange(incoming_, {});
  lock.unlock();
  for (const auto& exchange : late) exchange->fail(CURLE_ABORTED_BY_CALLBACK, kEnding);
}

std::optional<std::vector<CurlTransfers::ExchangeRef>> CurlTransfers::nextExchanges() {
  std::unique_lock lock(mutex_);
  const auto isCalled = [this] { return ending_ || !incoming_.empty(); };
  if (underWay_.empty() && !changed_.wait_for(lock, kIdleTime, isCalled)) {
    // The multi handle owns the connections, so replacing it closes them.
    if (auto fresh = newMultiHandle()) multi_ = std::move(fresh);
    wereMany_ = false;
    lock.unlock();
    malloc_trim(0);
    lock.lock();
    changed_.wait(lock, isCalled);
  }
  if (ending_) return std::nullopt;
  return std::exchange(incoming_, {});
}

void CurlTransfers::begin(ExchangeRef exchange) {
  Exchange& started = *exchange;
  try {
    started.prepare();
    deadlines_.emplace(started.deadline(), &started);
    underWay_.emplace(&started, std::move(exchange));
    wereMany_ = wereMany_ || underWay_.size() > kFewConnections;
    hasChanged_ = true;
  } catch (const std::exception& error) {
    deadlines_.erase({started.deadline(), &started});
    if (exchange) exchange->fail(CURLE_FAILED_INIT, error.what());
    return;
  }
  const CURLMcode code = curl_multi_add_handle(multi_.get(), started.handle());
  if (code != CURLM_OK) take(started)->fail(CURLE_FAILED_INIT, curl_multi_strerror(code));
}

void CurlTransfers::step() {
  const auto check = [](CURLMcode code) {
    if (code != CURLM_OK) throw std::runtime_error(curl_multi_strerror(code));
  };
  // When a transfer begins, libcurl 7.88 may forget that another one asked to continue at once. So another
  // pass follows each one in which a transfer began or ended.
  bool isQuiet = false;
  while (!isQuiet || hasChanged_) {
    isQuiet = !std::exchange(hasChanged_, false);
    int running = 0;
    check(curl_multi_perform(multi_.get(), &running));
    collectFinished();
    expire();
  }
  if (deadlines_.empty()) return;
  const auto left = std::chrono::ceil<milliseconds>(deadlines_.begin()->first - Clock::now());
  const auto limit = std::clamp(left, milliseconds(0), kLongestWait);
  check(curl_multi_poll(multi_.get(), nullptr, 0, static_cast<int>(limit.count()), nullptr));
}

void CurlTransfers::collectFinished() {
  int left = 0;
  while (const CURLMsg* const message = curl_multi_info_read(multi_.get(), &left)) {
    if (message->msg != CURLMSG_DONE) continue;
    hasChanged_ = true;
    const CURLcode code = message->data.result;
    char* finished = nullptr;
    curl_easy_getinfo(message->easy_handle, CURLINFO_PRIVATE, &finished);
    auto exchange = take(*reinterpret_cast<Exchange*>(finished));
    if (yields(*exchange, code) || exchange->goOn(code)) begin(std::move(exchange));
  }
}

/// When a service refuses one of many connections, uses fewer of them until all is idle. True when the
/// exchange may be tried again.
bool CurlTransfers::yields(Exchange& exchange, CURLcode code) {
  if (!mayBeTurnedAway(code) || !wereMany_) return false;
  curl_multi_setopt(multi_.get(), CURLMOPT_MAX_HOST_CONNECTIONS, kFewConnections);
  return exchange.takeSecondTry();
}

void CurlTransfers::expire() {
  const auto now = Clock::now();
  while (!deadlines_.empty() && deadlines_.begin()->first <= now) {
    take(*deadlines_.begin()->second)->fail(CURLE_OPERATION_TIMEDOUT, "timed out");
  }
}

CurlTransfers::ExchangeRef CurlTransfers::take(Exchange& exchange) {
  curl_multi_remove_handle(multi_.get(), exchange.handle());
  deadlines_.erase({exchange.deadline(), &exchange});
  return std::move(underWay_.extract(&exchange).mapped());
}

void CurlTransfers::failAll(CURLcode code, const char* text) {
  while (!underWay_.empty()) take(*underWay_.begin()->first)->fail(code, text);
}

}  // namespace
}  // namespace http_module

extern "C" __attribute__((visibility("default"))) HTTPTransfers* kvrNewHTTPTransfers() noexcept {
  try {
    // Never undone, because the library stays loaded.
    static const CURLcode initialised = curl_global_init(CURL_GLOBAL_DEFAULT);
    return initialised == CURLE_OK ? new http_module::CurlTransfers : nullptr;
  } catch (...) {
    return nullptr;
  }
}

}  // namespace kvr
