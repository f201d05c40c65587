#include "platform/local/FileWatch.h"

#include <sys/inotify.h>
#include <systemd/sd-event.h>
#include <unistd.h>

#include <array>
#include <cerrno>
#include <cstring>
#include <system_error>
#include <utility>

namespace kvr {
namespace {

constexpr std::uint32_t kChanges = IN_CLOSE_WRITE | IN_CREATE | IN_DELETE | IN_MOVED_FROM | IN_MOVED_TO;
constexpr std::uint32_t kOwnEnd = IN_DELETE_SELF | IN_MOVE_SELF;

}  // namespace

FileWatch::FileWatch(EventLoop& loop, std::filesystem::path path, std::function<void()> changed)
    : loop_(loop),
      path_(std::move(path)),
      name_(path_.filename().string()),
      changed_(std::move(changed)),
      inotify_(::inotify_init1(IN_NONBLOCK | IN_CLOEXEC)) {
  if (!inotify_) throw std::system_error(errno, std::generic_category(), "inotify_init1");
  watch();
  const auto readable = [](sd_event_source*, int, std::uint32_t, void* self) {
    static_cast<FileWatch*>(self)->readEvents();
    return 0;
  };
  const int result = ::sd_event_add_io(loop.event(), &source_, inotify_.get(), EPOLLIN, readable, this);
  if (result < 0) throw std::system_error(-result, std::generic_category(), "sd_event_add_io");
}

FileWatch::~FileWatch() { ::sd_event_source_disable_unref(source_); }

void FileWatch::watch() {
  if (watch_ >= 0) ::inotify_rm_watch(inotify_.get(), watch_);
  watch_ = -1;
  isInPlace_ = true;
  for (auto directory = path_.parent_path();; directory = directory.parent_path()) {
    const std::uint32_t events = isInPlace_ ? kChanges : IN_CREATE | IN_MOVED_TO;
    watch_ = ::inotify_add_watch(inotify_.get(), directory.c_str(), events | kOwnEnd | IN_ONLYDIR);
    if (watch_ >= 0 || !directory.has_relative_path()) return;
    isInPlace_ = false;
  }
}

void FileWatch::readEvents() {
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
        if (event.len == 0 || name_ == name) concerns = true;
        if (!isInPlace_ || (event.mask & (kOwnEnd | IN_IGNORED)) != 0) isWatchLost = true;
      }
      at += sizeof event + event.len;
    }
  }
  if (isWatchLost) watch();
  if (concerns || isWatchLost) loop_.post(changed_);
}

}  // namespace kvr
