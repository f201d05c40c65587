#include "Fuzz.h"
#include "platform/BinaryPropertyList.h"

#include <cstdint>

void kvr::fuzz::run(std::string_view input) {
  readAndWriteBack(input, [](std::string_view bytes) { return readBinaryPropertyList(bytes, SIZE_MAX); });
}
