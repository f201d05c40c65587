#include "local/system/LocalLog.h"

#include "local/system/Descriptor.h"

#include <poll.h>
#include <sys/stat.h>
#include <sys/sysmacros.h>
#include <unistd.h>

#include <algorithm>
#include <array>
#include <cerrno>
#include <charconv>
#include <climits>
#include <cstdlib>
#include <cstring>
#include <ctime>

namespace kvr {
namespace {

using namespace std::chrono_literals;

constexpr auto kPatience = 1s;
/// How many bytes a pipe that is ready accepts without blocking.
constexpr std::size_t kMostAtOnce = PIPE_BUF;

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
      return "7";
    case LogLevel::Error:
      return "3";
    default:
      return "5";
  }
}

/// Whether the descriptor is the journal stream that the service manager set up.
bool leadsToJournal(int descriptor) {
  struct stat status {};
  if (::fstat(descriptor, &status) != 0) return false;
  return environment("JOURNAL_STREAM") == std::to_string(status.st_dev) + ":" + std::to_string(status.st_ino);
}

/// Whether writing may block: a terminal, a pipe or a socket waits for its reader; a file and the null device
/// do not.
bool mayBlock(int descriptor) {
  struct stat status {};
  if (::fstat(descriptor, &status) != 0) return true;
  const bool isNull = S_ISCHR(status.st_mode) && ::major(status.st_rdev) == 1 && ::minor(status.st_rdev) == 3;
  return !S_ISREG(status.st_mode) && !isNull;
}

void appendNumber(std::string& text, long long number, std::size_t width) {
  std::array<char, 24> digits{};
  auto* const end = std::to_chars(digits.data(), digits.data() + digits.size(), number).ptr;
  const auto count = static_cast<std::size_t>(end - digits.data());
  if (count < width) text.append(width - count, '0');
  text.append(digits.data(), count);
}

/// "2026-11-24T16:04:43.012345Z"
void appendTimestamp(std::string& line) {
  timespec now{};
  ::clock_gettime(CLOCK_REALTIME, &now);
  const auto time = calendarTime(now.tv_sec);
  appendNumber(line, time.year, 4);
  appendNumber(line += '-', time.month, 2);
  appendNumber(line += '-', time.day, 2);
  appendNumber(line += 'T', time.hour, 2);
  appendNumber(line += ':', time.minute, 2);
  appendNumber(line += ':', time.second, 2);
  appendNumber(line += '.', now.tv_nsec / 1000, 6);
  line += 'Z';
}

/// Line breaks become \n and \r; other control characters, and Unicode's line breaks, become \xNN per byte.
void appendEscaped(std::string& line, std::string_view message) {
  const auto appendHex = [&line](char c) {
    static constexpr char kDigits[] = "0123456789abcdef";
    const auto byte = static_cast<unsigned char>(c);
    line += "\\x";
    line += kDigits[byte >> 4U];
    line += kDigits[byte & 0xFU];
  };
  const auto isPlain = [](char c) { return c >= ' ' && c <= '~'; };
  for (std::size_t at = 0; at < message.size(); ++at) {
    const auto* const run = message.data() + at;
    const auto* const end = std::find_if_not(run, message.data() + message.size(), isPlain);
    line.append(run, end);
    at += static_cast<std::size_t>(end - run);
    if (at == message.size()) break;
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

std::string journalEntry(LogLevel level, const std::string& message) {
  std::string entry;
  entry.reserve(message.size() + 128);
  JournalSocket::appendField(entry, "MESSAGE", message);
  JournalSocket::appendField(entry, "PRIORITY", priorityOf(level));
  JournalSocket::appendField(entry, "SYSLOG_IDENTIFIER", "kvragent");
  JournalSocket::appendField(entry, "SUBSYSTEM", Log::kSubsystem);
  JournalSocket::appendField(entry, "CATEGORY", Log::kCategory);
  return entry;
}

}  // namespace

std::unique_ptr<LocalLog> LocalLog::fromEnvironment() {
  return std::make_unique<LocalLog>(
      levelNamed(environment("KVR_LOG_LEVEL")), environment("KVR_LOG_PRIVATE") == "1",
      leadsToJournal(STDERR_FILENO) ? Sink::Journal : Sink::Lines, STDERR_FILENO);
}

LocalLog::LocalLog(LogLevel least, bool revealPrivate, Sink sink, int descriptor)
    : Log(least, revealPrivate), sink_(sink), descriptor_(descriptor), mayBlock_(mayBlock(descriptor)) {}

void LocalLog::write(LogLevel level, const std::string& message) {
  if (sink_ == Sink::Journal && writeEntry(level, message)) return;
  writeLine(level, message);
}

/// False if there is no journal. If it accepts nothing for a while, entries are dropped without waiting until
/// it has taken one again.
bool LocalLog::writeEntry(LogLevel level, const std::string& message) {
  const auto entry = journalEntry(level, message);
  const std::lock_guard lock(mutex_);
  const auto outcome = journal_.send(entry, std::chrono::steady_clock::now() + (stuck_ ? 0s : kPatience));
  stuck_ = outcome == JournalSocket::Outcome::Full;
  return outcome != JournalSocket::Outcome::Failed;
}

void LocalLog::writeLine(LogLevel level, const std::string& message) {
  std::string line;
  line.reserve(message.size() + 96);
  appendTimestamp(line);
  line.append(" ").append(nameOf(level)).append(" ");
  line.append(kSubsystem).append(":").append(kCategory).append(" ");
  appendEscaped(line, message);
  line += '\n';
  if (!mayBlock_) {
    writeAll(descriptor_, line);
    return;
  }
  const std::lock_guard lock(mutex_);
  if (torn_) line.insert(0, "\n");
  const auto deadline = std::chrono::steady_clock::now() + (stuck_ ? 0s : kPatience);
  std::string_view rest = line;
  while (!rest.empty() && isReady(deadline) && writeAll(descriptor_, rest.substr(0, kMostAtOnce))) {
    rest.remove_prefix(std::min(kMostAtOnce, rest.size()));
  }
  stuck_ = !rest.empty();
  if (rest.size() < line.size()) torn_ = stuck_;
}

/// Whether the descriptor accepts a whole piece without blocking. If a reader accepts nothing for a while,
/// lines are dropped without waiting until it has taken a whole line again.
bool LocalLog::isReady(std::chrono::steady_clock::time_point deadline) {
  using std::chrono::milliseconds;
  const auto left = std::chrono::ceil<milliseconds>(deadline - std::chrono::steady_clock::now()).count();
  pollfd state{descriptor_, POLLOUT, 0};
  return ::poll(&state, 1, static_cast<int>(std::max<milliseconds::rep>(left, 0))) != 0;
}

}  // namespace kvr
