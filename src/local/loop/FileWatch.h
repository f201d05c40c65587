#pragma once

#include "local/loop/EventLoop.h"
#include "local/system/Descriptor.h"
#include "platform/log/Log.h"

#include <cstddef>
#include <filesystem>
#include <functional>
#include <string>

namespace kvr {

/// Reports that a file may have changed, appeared or gone.
///
/// Watches the file's directory with inotify, without polling. If that directory does not exist yet, the
/// nearest existing one above it is watched. A file that is written in place counts once it is closed. Built
/// and destroyed on the loop's thread.
class FileWatch {
 public:
  /// `writes`: how often the file has been written or moved into place since the last call; 0 when it has
  /// gone or may be about to be written.
  using Changed = std::function<void(std::size_t writes)>;

  /// `changed` is posted to the loop; it may be called without a change. If the kernel refuses the watch, one
  /// error line is logged and no change is reported.
  FileWatch(EventLoop& loop, Log& log, std::filesystem::path path, Changed changed);
  ~FileWatch();
  FileWatch(const FileWatch&) = delete;
  FileWatch& operator=(const FileWatch&) = delete;

 private:
  void watch();
  void readEvents();

  EventLoop& loop_;
  const std::filesystem::path path_;
  const Changed changed_;
  Descriptor inotify_;
  sd_event_source* source_ = nullptr;
  int watch_ = -1;
  std::filesystem::path awaited_;  ///< the file, or the missing directory on the way to it
};

}  // namespace kvr
