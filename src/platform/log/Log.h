#pragma once

#include "platform/log/Format.h"

#include <atomic>

namespace kvr {

enum class LogLevel { Debug, Default, Error };

/// The agent's one log channel: subsystem "com.tarsil.Kavrel", category "core".
///
/// Any thread may write at any time. Writing never fails and never throws what the caller must handle.
class Log {
 public:
  static constexpr std::string_view kSubsystem = "com.tarsil.Kavrel";
  static constexpr std::string_view kCategory = "core";

  Log(LogLevel least, bool revealPrivate) : least_(least), revealPrivate_(revealPrivate) {}
  virtual ~Log() = default;
  Log(const Log&) = delete;
  Log& operator=(const Log&) = delete;

  /// A line at the default level.
  template <class... A>
  void standard(FormatString<std::type_identity_t<A>...> text, const A&... arguments) {
    line(LogLevel::Default, text.text(), arguments...);
  }
  template <class... A>
  void error(FormatString<std::type_identity_t<A>...> text, const A&... arguments) {
    line(LogLevel::Error, text.text(), arguments...);
  }
  template <class... A>
  void debug(FormatString<std::type_identity_t<A>...> text, const A&... arguments) {
    line(LogLevel::Debug, text.text(), arguments...);
  }

  bool isEnabled(LogLevel level) const { return level >= least_; }

  /// Call it when the process begins to end: from then on misused completions are not reported.
  void beginEnding() { ending_ = true; }
  /// Reports an answer that was never given, or given twice; nothing while the process is ending.
  virtual void reportMisusedCompletion(std::string_view what, std::string_view name) {
    if (!ending_) error("%s: %s", name, what);
  }

 protected:
  bool isEnding() const { return ending_; }
  /// One message, its private values already redacted. May hold line breaks. Called from any thread.
  virtual void write(LogLevel level, const std::string& message) = 0;

 private:
  template <class... A>
  void line(LogLevel level, std::string_view text, const A&... arguments) {
    if (!isEnabled(level)) return;
    const format_detail::Argument list[] = {format_detail::argument(arguments)...,
                                            {format_detail::Kind::Object, nullptr, nullptr}};
    write(level, format_detail::fill(text, {list, sizeof...(A)}, revealPrivate_));
  }

  const LogLevel least_;
  const bool revealPrivate_;
  std::atomic<bool> ending_{false};
};

}  // namespace kvr
