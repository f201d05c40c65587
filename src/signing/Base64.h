#pragma once

#include <string>
#include <string_view>

namespace kvr {

/// Base64 in the standard alphabet, padded with "=", without line breaks. Any thread.
std::string base64Encoded(std::string_view bytes);

}  // namespace kvr
