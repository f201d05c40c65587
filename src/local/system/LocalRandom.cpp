#include "local/system/LocalRandom.h"

#include <sys/random.h>

#include <array>
#include <cerrno>
#include <system_error>

namespace kvr {

std::string LocalRandom::uuid() {
  std::array<unsigned char, 16> bytes{};
  // So few bytes are never returned in part.
  while (::getrandom(bytes.data(), bytes.size(), 0) < 0) {
    if (errno != EINTR) throw std::system_error(errno, std::generic_category(), "getrandom");
  }
  bytes[6] = static_cast<unsigned char>((bytes[6] & 0x0FU) | 0x40U);  // version 4, random
  bytes[8] = static_cast<unsigned char>((bytes[8] & 0x3FU) | 0x80U);

  std::string text;
  text.reserve(36);
  for (std::size_t i = 0; i < bytes.size(); ++i) {
    if (i == 4 || i == 6 || i == 8 || i == 10) text += '-';
    text += "0123456789ABCDEF"[bytes[i] >> 4U];
    text += "0123456789ABCDEF"[bytes[i] & 0x0FU];
  }
  return text;
}

}  // namespace kvr
