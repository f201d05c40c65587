#include "Fuzz.h"
#include "platform/BinaryPropertyList.h"

void kvr::fuzz::run(std::string_view input) { readAndWriteBack(input, readBinaryPropertyList); }
