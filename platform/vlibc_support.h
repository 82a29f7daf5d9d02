// The appliance's capability table: what this model supports, fixed at the factory.
#pragma once
#include "platform_export.h"

QUIB_BEGIN_C

// 1 when the capability key is listed as supported in QUIB_INFO_DEFAULTS_CONF (its value is a
// true boolean: yes, true, on, 1; e.g. support_s2s="yes"), 0 when not: the key absent or false,
// or no table at all. Keys match exactly. -1 with 0x0D00 for a null or empty key, 0x0900 when
// the table exists but can't be read.
QUIB_API int VLIBCSupportGet(const char *key);

QUIB_END_C
