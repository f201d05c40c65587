#include "platform/text/URL.h"

#include "platform/text/Numbers.h"

#include <algorithm>
#include <utility>

namespace kvr {
namespace {

// URLs have ASCII letters only, whatever the process's locale.
bool isDigit(char c) { return c >= '0' && c <= '9'; }
bool isLetter(char c) { return (c >= 'a' && c <= 'z') || (c >= 'A' && c <= 'Z'); }
bool isBlankOrControl(char c) { return (c >= '\0' && c <= ' ') || c == '\x7f'; }

std::string lowered(std::string_view text) {
  std::string result(text);
  for (char& c : result) {
    if (c >= 'A' && c <= 'Z') c = static_cast<char>(c - 'A' + 'a');
  }
  return result;
}

std::optional<std::string> withoutPercentEscapes(std::string_view text) {
  std::string result;
  for (std::size_t at = 0; at < text.size(); ++at) {
    if (text[at] != '%') {
      result += text[at];
      continue;
    }
    if (text.size() - at < 3) return std::nullopt;
    const int high = hexadecimalDigit(text[at + 1]);
    const int low = hexadecimalDigit(text[at + 2]);
    if (high < 0 || low < 0 || high + low == 0) return std::nullopt;
    result += static_cast<char>(high * 16 + low);
    at += 2;
  }
  return result;
}

bool isScheme(std::string_view text) {
  return !text.empty() && isLetter(text.front()) && std::ranges::all_of(text, [](char c) {
    return isLetter(c) || isDigit(c) || c == '+' || c == '-' || c == '.';
  });
}

bool isPort(std::string_view text) {
  return text.size() <= 5 && std::ranges::all_of(text, isDigit) &&
         (text.empty() || std::stoi(std::string(text)) <= 65535);
}

/// The host of an authority `user@host:port`, lower case and without brackets; nothing when it names none.
std::optional<std::string> hostOf(std::string_view authority) {
  if (const auto at = authority.rfind('@'); at != std::string_view::npos) authority.remove_prefix(at + 1);
  std::string_view host;
  if (authority.starts_with('[')) {
    const auto close = authority.find(']');
    if (close == std::string_view::npos) return std::nullopt;
    host = authority.substr(1, close - 1);
    authority.remove_prefix(close + 1);
    if (!std::ranges::all_of(host, [](char c) { return hexadecimalDigit(c) >= 0 || c == ':' || c == '.'; })) {
      return std::nullopt;
    }
  } else {
    host = authority.substr(0, authority.find(':'));
    authority.remove_prefix(host.size());
    if (!std::ranges::all_of(host, [](char c) {
          return isLetter(c) || isDigit(c) || c == '-' || c == '.' || c == '_' ||
                 static_cast<unsigned char>(c) >= 0x80;
        })) {
      return std::nullopt;
    }
  }
  if (host.empty()) return std::nullopt;
  if (!authority.empty() && (authority.front() != ':' || !isPort(authority.substr(1)))) return std::nullopt;
  return lowered(host);
}

/// Whether this is an IPv4 address 127.x.x.x, written in plain decimals.
bool isLoopbackIPv4(std::string_view host) {
  int parts = 0;
  while (true) {
    const auto part = host.substr(0, host.find('.'));
    if (part.empty() || part.size() > 3 || !std::ranges::all_of(part, isDigit)) return false;
    if (part.size() > 1 && part.front() == '0') return false;
    const int number = std::stoi(std::string(part));
    if (number > 255 || (parts == 0 && number != 127)) return false;
    ++parts;
    if (part.size() == host.size()) return parts == 4;
    host.remove_prefix(part.size() + 1);
  }
}

}  // namespace

std::optional<URL> URL::parse(std::string_view text) {
  if (std::ranges::any_of(text, isBlankOrControl)) return std::nullopt;
  const auto colon = text.find(':');
  if (colon == std::string_view::npos || !isScheme(text.substr(0, colon))) return std::nullopt;

  URL url;
  url.text_ = text;
  url.scheme_ = lowered(text.substr(0, colon));
  std::string_view rest = text.substr(colon + 1);
  rest = rest.substr(0, rest.find_first_of("?#"));
  std::string_view authority;
  const bool hasAuthority = rest.starts_with("//");
  if (hasAuthority) {
    authority = rest.substr(2, std::min(rest.find('/', 2), rest.size()) - 2);
    rest.remove_prefix(2 + authority.size());
  }

  if (url.isFile()) {
    if (!authority.empty() && lowered(authority) != "localhost") return std::nullopt;
    auto path = withoutPercentEscapes(rest);
    if (!path || !path->starts_with('/')) return std::nullopt;
    url.filePath_ = *std::move(path);
    return url;
  }
  auto host = hostOf(authority);
  if (!host && url.isWeb()) return std::nullopt;
  url.host_ = std::move(host).value_or("");
  return url;
}

URL URL::fileURL(std::string path) {
  static constexpr char kHex[] = "0123456789ABCDEF";
  URL url;
  url.text_ = "file://";
  for (const char c : path) {
    if (isLetter(c) || isDigit(c) ||
        std::string_view("/-._~!$&'()*+,=:@").find(c) != std::string_view::npos) {
      url.text_ += c;
    } else {
      const auto byte = static_cast<unsigned char>(c);
      url.text_ += {'%', kHex[byte >> 4], kHex[byte & 15]};
    }
  }
  url.scheme_ = "file";
  url.filePath_ = std::move(path);
  return url;
}

bool URL::isLoopback() const { return host_ == "localhost" || host_ == "::1" || isLoopbackIPv4(host_); }

}  // namespace kvr
