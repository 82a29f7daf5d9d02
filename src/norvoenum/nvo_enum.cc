// NvoEnum's lifetime: out of line, so the tables it grows are built and torn down inside the
// library whatever the caller was compiled against.
#include "norvo/norvoenum.h"

NvoEnum::NvoEnum() = default;
NvoEnum::~NvoEnum() = default;
