#pragma once

#include "local/loop/EventLoop.h"
#include "local/system/Descriptor.h"
#include "platform/log/Log.h"

#include <cstddef>
#include <filesystem>
#include <functional>
#include <string>

namespace kvr {

/// Notices that a file may have changed, come or gone.
///
/// The file's directory is watched, not asked again and again; one that does not exist yet is waited for in
/// the nearest one that does. A file that is written in place counts once it is closed. Built and destroyed
/// on the loop's thread.
class FileWatch {
 public:
  /// Told how often the file has been written, or put in place, meanwhile: 0 when it has gone, or may be
  /// about to be written.
  using Changed = std::function<void(std::size_t writes)>;

  /// `changed` is posted to the loop; it may be called without a change. Where the kernel refuses, which is
  /// one error line, nothing is noticed.
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
  std::filesystem::path awaited_;  ///< the file, or the missing directory that leads to it
};

}  // namespace kvr
