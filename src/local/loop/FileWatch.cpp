#include "local/loop/FileWatch.h"

#include <sys/inotify.h>
#include <systemd/sd-event.h>
#include <unistd.h>

#include <array>
#include <cerrno>
#include <cstring>
#include <exception>
#include <system_error>
#include <utility>

namespace kvr {
namespace {

constexpr std::uint32_t kWrites = IN_CLOSE_WRITE | IN_MOVED_TO;
constexpr std::uint32_t kChanges = kWrites | IN_CREATE | IN_DELETE | IN_MOVED_FROM;
constexpr std::uint32_t kOwnEnd = IN_DELETE_SELF | IN_MOVE_SELF;

}  // namespace

FileWatch::FileWatch(EventLoop& loop, Log& log, std::filesystem::path path, Changed changed)
    : loop_(loop),
      path_(std::move(path)),
      changed_(std::move(changed)),
      inotify_(::inotify_init1(IN_NONBLOCK | IN_CLOEXEC)) {
  const auto readable = [](sd_event_source*, int, std::uint32_t, void* self) {
    try {
      static_cast<FileWatch*>(self)->readEvents();
    } catch (const std::exception&) {
      return 0;  // out of memory: this change is missed
    }
    return 0;
  };
  int reason = inotify_ ? 0 : errno;
  if (inotify_) {
    watch();
    if (watch_ < 0) reason = errno;
    const int result = ::sd_event_add_io(loop.event(), &source_, inotify_.get(), EPOLLIN, readable, this);
    if (result < 0) reason = -result;
  }
  if (reason != 0) {
    log.error("changes of %@ are not noticed: %@", path_.string(), std::generic_category().message(reason));
  }
}

FileWatch::~FileWatch() { ::sd_event_source_disable_unref(source_); }

void FileWatch::watch() {
  std::error_code unknown;
  do {
    if (watch_ >= 0) ::inotify_rm_watch(inotify_.get(), watch_);
    awaited_ = path_;
    while ((watch_ = ::inotify_add_watch(inotify_.get(), awaited_.parent_path().c_str(),
                                         kChanges | kOwnEnd | IN_ONLYDIR)) < 0 &&
           awaited_.parent_path().has_relative_path()) {
      awaited_ = awaited_.parent_path();
    }
    // If the directory appeared before its parent was watched, no event would report it.
  } while (watch_ >= 0 && awaited_ != path_ && std::filesystem::is_directory(awaited_, unknown));
}

void FileWatch::readEvents() {
  alignas(inotify_event) std::array<char, 16384> buffer{};
  const std::string awaited = awaited_.filename().string();
  bool concerns = false;
  bool isWatchLost = false;
  std::size_t writes = 0;
  for (;;) {
    const auto size = ::read(inotify_.get(), buffer.data(), buffer.size());
    if (size <= 0) break;
    for (std::size_t at = 0; at < static_cast<std::size_t>(size);) {
      inotify_event event{};
      std::memcpy(&event, buffer.data() + at, sizeof event);
      const char* const name = buffer.data() + at + sizeof event;
      // Events of an earlier watch do not count. A queue overflow (wd -1) may have lost any event.
      if (event.wd == watch_ || event.wd == -1) {
        if (event.len == 0 || awaited == name) concerns = true;
        if (event.len != 0 && awaited == name && (event.mask & kWrites) != 0) ++writes;
        if ((event.mask & (kOwnEnd | IN_IGNORED)) != 0) isWatchLost = true;
      }
      at += sizeof event + event.len;
    }
  }
  if (awaited_ != path_) writes = 0;
  if (isWatchLost || (concerns && awaited_ != path_)) watch();
  if (concerns || isWatchLost) loop_.post([changed = changed_, writes] { changed(writes); });
}

}  // namespace kvr
