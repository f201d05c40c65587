#include "Fuzz.h"
#include "platform/codec/ASCIIPropertyList.h"

void kvr::fuzz::run(std::string_view input) { readAndWriteBack(input, readASCIIPropertyList); }
