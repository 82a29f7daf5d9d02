// Share synchronisation to another appliance, as configured per share.
#pragma once
#include "platform_export.h"

QUIB_BEGIN_C

// 1 when the share named name (case-insensitive) is synchronised ("synced = yes" in its
// section of QUIB_SHARE_CONF), 0 when it is not (the key absent or false). -1 with 0x1400 when
// there is no such share, 0x0900 when the configuration can't be read, 0x0D00 for a null or
// empty name.
QUIB_API int QUIBS2SIsSyncedShare(const char *name);

QUIB_END_C
