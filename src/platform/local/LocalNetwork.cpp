#include "platform/local/LocalNetwork.h"

#include <sys/inotify.h>
#include <systemd/sd-event.h>
#include <unistd.h>

#include <array>
#include <cerrno>
#include <cstring>
#include <filesystem>
#include <system_error>
#include <utility>

namespace kvr {
namespace {

constexpr const char* kFile = "Network.plist";

constexpr std::uint32_t kChanges = IN_CLOSE_WRITE | IN_CREATE | IN_DELETE | IN_MOVED_FROM | IN_MOVED_TO;
constexpr std::uint32_t kOwnEnd = IN_DELETE_SELF | IN_MOVE_SELF;

}  // namespace

LocalNetwork::LocalNetwork(EventLoop& loop, const DeviceRoot& root, std::function<void(bool)> changed)
    : root_(root), changed_(std::move(changed)), inotify_(::inotify_init1(IN_NONBLOCK | IN_CLOEXEC)) {
  if (!inotify_) throw std::system_error(errno, std::generic_category(), "inotify_init1");
  watch();
  const auto readable = [](sd_event_source*, int, std::uint32_t, void* self) {
    static_cast<LocalNetwork*>(self)->readEvents();
    return 0;
  };
  const int result = ::sd_event_add_io(loop.event(), &source_, inotify_.get(), EPOLLIN, readable, this);
  if (result < 0) throw std::system_error(-result, std::generic_category(), "sd_event_add_io");
}

LocalNetwork::~LocalNetwork() { ::sd_event_source_disable_unref(source_); }

bool LocalNetwork::isReachable() const {
  const auto reachable = root_.dictionary(kFile)["reachable"];
  return !reachable.isBool() || reachable.boolean();
}

void LocalNetwork::watch() {
  if (watch_ >= 0) ::inotify_rm_watch(inotify_.get(), watch_);
  watch_ = -1;
  const auto directory = std::filesystem::path(root_.pathOf(kFile)).parent_path();
  isWatchingRoot_ = true;
  for (auto path = directory;; path = path.parent_path()) {
    const std::uint32_t events = isWatchingRoot_ ? kChanges : IN_CREATE | IN_MOVED_TO;
    watch_ = ::inotify_add_watch(inotify_.get(), path.c_str(), events | kOwnEnd | IN_ONLYDIR);
    if (watch_ >= 0 || !path.has_relative_path()) return;
    isWatchingRoot_ = false;
  }
}

void LocalNetwork::readEvents() {
  alignas(inotify_event) std::array<char, 16384> buffer{};
  bool concerns = false;
  bool isWatchLost = false;
  for (;;) {
    const auto size = ::read(inotify_.get(), buffer.data(), buffer.size());
    if (size <= 0) break;
    for (std::size_t at = 0; at < static_cast<std::size_t>(size);) {
      inotify_event event{};
      std::memcpy(&event, buffer.data() + at, sizeof event);
      const char* const name = buffer.data() + at + sizeof event;
      // An older watch's last words concern nobody; a lost event (which names none) may be any.
      if (event.wd == watch_ || event.wd == -1) {
        if (event.len == 0 || std::strcmp(name, kFile) == 0) concerns = true;
        if (!isWatchingRoot_ || (event.mask & (kOwnEnd | IN_IGNORED)) != 0) isWatchLost = true;
      }
      at += sizeof event + event.len;
    }
  }
  if (isWatchLost) watch();
  if (concerns || isWatchLost) changed_(isReachable());
}

}  // namespace kvr
