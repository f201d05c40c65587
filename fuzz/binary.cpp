#include "Fuzz.h"
#include "platform/codec/BinaryPropertyList.h"

void kvr::fuzz::run(std::string_view input) { readAndWriteBack(input, readBinaryPropertyList); }
