// The headers that every test begins with, compiled once: see CMakeLists.txt.

#include "Prelude.h"
