// Automatic blocking of client addresses that keep failing to log in. Failures are kept per
// address in SQLite (QUIB_AUTOBLOCK_DB, in root's own directory: only root records or reads
// them). An address is blocked while it has "auto_block_attempts" failures (default 5; 0 turns
// blocking off) within the last "auto_block_within_minutes" (default 5) of /etc/quibinfo.conf;
// the block lifts as the failures age out of that window. Addresses are IPv4 or IPv6 literals,
// compared in canonical form (an IPv4-mapped IPv6 address is its IPv4 address); anything else
// is 0x0D00.
#pragma once
#include "platform_export.h"

QUIB_BEGIN_C

// 1 when ip is blocked, 0 when not (also when nothing was ever recorded); -1 with 0x0D00 for
// an address that is not an IP literal, 0x0300 when the caller is not root or the database's
// directory is not root's own, another code on failure.
QUIB_API int QuibCgiIsDeniedIP(const char *ip);
// Records a failed login of ip to service (1 to 64 characters of A-Z a-z 0-9 _ . -). An address
// holds at most the threshold's number of failures: more would only lengthen its block. 0; -1
// as QuibCgiIsDeniedIP (0x0D00 also for a bad service).
QUIB_API int AutoBlockFailLoginSet(const char *ip, const char *service);
// Forgets every failure of ip, whatever the service. 0; -1 as QuibCgiIsDeniedIP.
QUIB_API int QUIBAutoBlockResetByIP(const char *ip);

QUIB_END_C
