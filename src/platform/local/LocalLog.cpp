#include "platform/local/LocalLog.h"

#define SD_JOURNAL_SUPPRESS_LOCATION
#include <poll.h>
#include <sys/stat.h>
#include <sys/uio.h>
#include <systemd/sd-journal.h>
#include <unistd.h>

#include <array>
#include <cerrno>
#include <charconv>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <ctime>

namespace kvr {
namespace {

constexpr int kPatienceMilliseconds = 1000;

std::string_view environment(const char* name) {
  const char* value = std::getenv(name);
  return value == nullptr ? std::string_view() : std::string_view(value);
}

LogLevel levelNamed(std::string_view name) {
  if (name == "debug") return LogLevel::Debug;
  return name == "error" ? LogLevel::Error : LogLevel::Default;
}

const char* nameOf(LogLevel level) {
  switch (level) {
    case LogLevel::Debug:
      return "debug";
    case LogLevel::Error:
      return "error";
    default:
      return "default";
  }
}

const char* priorityOf(LogLevel level) {
  switch (level) {
    case LogLevel::Debug:
      return "PRIORITY=7";
    case LogLevel::Error:
      return "PRIORITY=3";
    default:
      return "PRIORITY=5";
  }
}

/// Whether standard error is the very stream to the journal that the service manager set up.
bool leadsToJournal(int descriptor) {
  struct stat status {};
  if (::fstat(descriptor, &status) != 0) return false;
  return environment("JOURNAL_STREAM") == std::to_string(status.st_dev) + ":" + std::to_string(status.st_ino);
}

std::string timestamp() {
  timespec now{};
  ::clock_gettime(CLOCK_REALTIME, &now);
  const auto time = calendarTime(now.tv_sec);
  char text[120];
  std::snprintf(text, sizeof text, "%04lld-%02d-%02dT%02d:%02d:%02d.%06ldZ", time.year, time.month, time.day,
                time.hour, time.minute, time.second, now.tv_nsec / 1000);
  return text;
}

/// Line breaks as \n and \r; other control characters, and Unicode's own line breaks, as \xNN a byte.
void appendEscaped(std::string& line, std::string_view message) {
  const auto appendHex = [&line](char c) {
    static constexpr char kDigits[] = "0123456789abcdef";
    const auto byte = static_cast<unsigned char>(c);
    line += "\\x";
    line += kDigits[byte >> 4U];
    line += kDigits[byte & 0xFU];
  };
  for (std::size_t at = 0; at < message.size(); ++at) {
    const char c = message[at];
    const auto rest = message.substr(at);
    if (c == '\n') {
      line += "\\n";
    } else if (c == '\r') {
      line += "\\r";
    } else if ((c >= 0 && c < ' ' && c != '\t') || c == '\x7f') {
      appendHex(c);
    } else if (c == '\xc2' && rest.size() > 1 && static_cast<unsigned char>(rest[1]) < 0xa0) {
      appendHex(c);
      appendHex(message[++at]);
    } else if (rest.starts_with("\xe2\x80\xa8") || rest.starts_with("\xe2\x80\xa9")) {
      appendHex(c);
      appendHex(message[++at]);
      appendHex(message[++at]);
    } else {
      line += c;
    }
  }
}

bool sendToJournal(LogLevel level, const std::string& message) {
  const std::string text = "MESSAGE=" + message;
  const std::string subsystem = "SUBSYSTEM=" + std::string(Log::kSubsystem);
  const std::string category = "CATEGORY=" + std::string(Log::kCategory);
  const auto field = [](std::string_view line) {
    return iovec{const_cast<char*>(line.data()), line.size()};  // NOLINT: the journal only reads it
  };
  const std::array fields{field(text), field(priorityOf(level)), field("SYSLOG_IDENTIFIER=kvragent"),
                          field(subsystem), field(category)};
  return ::sd_journal_sendv(fields.data(), static_cast<int>(fields.size())) == 0;
}

}  // namespace

std::unique_ptr<LocalLog> LocalLog::fromEnvironment() {
  return std::make_unique<LocalLog>(
      levelNamed(environment("KVR_LOG_LEVEL")), environment("KVR_LOG_PRIVATE") == "1",
      leadsToJournal(STDERR_FILENO) ? Sink::Journal : Sink::Lines, STDERR_FILENO);
}

LocalLog::LocalLog(LogLevel least, bool revealPrivate, Sink sink, int descriptor)
    : Log(least, revealPrivate), sink_(sink), descriptor_(descriptor) {}

void LocalLog::write(LogLevel level, const std::string& message) {
  if (sink_ == Sink::Journal && sendToJournal(level, message)) return;
  writeLine(level, message);
}

void LocalLog::writeLine(LogLevel level, const std::string& message) {
  std::string line = timestamp();
  line.reserve(line.size() + message.size() + 64);
  line.append(" ").append(nameOf(level)).append(" ");
  line.append(kSubsystem).append(":").append(kCategory).append(" ");
  appendEscaped(line, message);
  line += '\n';
  std::string_view rest = line;
  while (!rest.empty() && isReady()) {
    const auto count = ::write(descriptor_, rest.data(), rest.size());
    if (count < 0 && errno == EINTR) continue;
    if (count < 0) return;
    rest.remove_prefix(static_cast<std::size_t>(count));
  }
}

/// Whether the reader takes lines. One that takes none for a while costs lines, not the agent's time: it is
/// waited for again only after it has taken one.
bool LocalLog::isReady() {
  pollfd state{descriptor_, POLLOUT, 0};
  const bool ready = ::poll(&state, 1, stuck_ ? 0 : kPatienceMilliseconds) != 0;
  stuck_ = !ready;
  return ready;
}

}  // namespace kvr
