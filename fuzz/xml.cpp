#include "Fuzz.h"
#include "platform/codec/XMLPropertyList.h"

void kvr::fuzz::run(std::string_view input) { readAndWriteBack(input, readXMLPropertyList); }
