#include "local/locale/LocaleModule.h"

#include <unicode/unum.h>
#include <unicode/ustring.h>

#include <array>
#include <charconv>
#include <memory>

// Exported under the name in `kDecimalStringSymbol`.
extern "C" __attribute__((visibility("default"))) int kvr_decimal_string(const char* locale,
                                                                         std::uint64_t number, char* buffer,
                                                                         std::size_t size) {
  UErrorCode status = U_ZERO_ERROR;
  const std::unique_ptr<UNumberFormat, decltype(&unum_close)> format(
      unum_open(UNUM_DECIMAL, nullptr, 0, locale, nullptr, &status), &unum_close);
  if (U_FAILURE(status)) return -1;
  // Passed as digits, because the number may exceed the library's integer types.
  std::array<char, 24> digits{};
  const auto end = std::to_chars(digits.data(), digits.data() + digits.size(), number).ptr;
  std::array<UChar, 128> text{};
  const auto length = unum_formatDecimal(format.get(), digits.data(), static_cast<int>(end - digits.data()),
                                         text.data(), static_cast<int>(text.size()), nullptr, &status);
  int written = 0;
  u_strToUTF8(buffer, static_cast<int>(size), &written, text.data(), length, &status);
  return U_FAILURE(status) ? -1 : written;
}
