// The file-transfer log, the dynamic-DNS entries and the platform's configuration reader.
#pragma once
#include <stddef.h>

#include "platform_export.h"

#define QUIB_XFERLOG_TAG "quib-xferlog"  // the transfer records' syslog tag (facility local6)
#define QUIB_DDNS_CONF "/usr/quib/etc/ddns.conf"

// One dynamic-DNS entry.
typedef struct _tag_QUIB_DDNS_CONFIG_ {
    char szName[128];      // the entry's name (the "ddns_select" setting names one)
    char szProvider[64];   // the service
    char szHostname[256];  // the host name it keeps up to date
    char szUsername[128];  // the account at the service
} QUIB_DDNS_CONFIG, *PQUIB_DDNS_CONFIG;

QUIB_BEGIN_C

// Records one transfer in the file-transfer log: a syslog record of facility local6, tag
// QUIB_XFERLOG_TAG, priority info, sent to /dev/log by the call itself, so it works whatever the
// process's identity and leaves the process's own syslog settings alone. The text is
//   client="IP" user="USER" action="ACTION" size=N type=dir|file path="PATH"
// with every byte below 0x20, DEL, '"' and '\' of the quoted fields written as \xNN, so no field
// can end a record or fake another. 0 on success; -1 with 0x0D00 (a null or empty ip, user,
// action or path, a negative size) or the errno of the socket translated.
QUIB_API int QUIBLogOBXFMXferLog(const char *ip, const char *user, const char *action, long long size,
                                 const char *path, int isDir);

// Fills *config with the entry name of QUIB_DDNS_CONF (keys "<name>.provider",
// "<name>.hostname", "<name>.username"). 0 on success; -1 with errno ENOENT and 0x0900 when the
// file or the entry's host name is missing, EINVAL and 0x0D00 for a bad name or a host name
// that is not one (only letters, digits, '-' and '.', at most 253 bytes): it ends up in links.
QUIB_API int QUIBDDNSConfigGet(const char *name, PQUIB_DDNS_CONFIG config);

// The appliance setting key of /etc/quibinfo.conf into buf (size bytes, always terminated;
// longer values are cut), or defaultValue (may be null: "") when the key or the file is
// absent. 0 on success; -1 with 0x0D00 for bad arguments, or the reader's code when the file
// exists but can't be read.
QUIB_API int QuibConf(const char *key, const char *defaultValue, char *buf, size_t size);

QUIB_END_C
