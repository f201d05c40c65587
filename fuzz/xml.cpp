#include "Fuzz.h"
#include "platform/XMLPropertyList.h"

void kvr::fuzz::run(std::string_view input) { readAndWriteBack(input, readXMLPropertyList); }
