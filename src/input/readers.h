// Input readers: fill one band of component sample rows from the caller's
// pixels, in the layout that the context's format code names. The reader of
// each format is found through its entry in the format table.
#pragma once

#include "input/formats.h"
