// The shares a domain or directory-service account may see, for the listing of "/".
#pragma once
#include "platform_export.h"
#include "vlibc_szlist.h"

QUIB_BEGIN_C

// The names of the shares user may see, in configuration order, or sorted ignoring ASCII case
// when sort is non-zero: hidden shares and those whose no-access list names user (or can't be
// checked) are left out; a share is in when its read-write list names user, or, unless
// writableOnly, its read-only list. A new list, freed with VLIBCSzListFree.
// context (the request's context) is accepted and not consulted: the names grant nothing, each
// later privilege lookup checks the login itself.
// Null on failure: 0x0900 when the service is not configured (domain: "workgroup" non-empty and
// "domain_joined" = yes; directory: "ldap_server" non-empty and "ldap_enabled" = yes, in
// QUIB_INFO_CONF); 0x0D00 for a name that is not acceptable or not of the service's kind (the
// domain call takes "DOMAIN\user" names, also with an "@"; the directory call "user@realm");
// the share cursor's code when the configuration can't be read; 0x2B00 out of memory.
QUIB_API PSZLIST QuibCgiDomValidShareGen(const char *context, const char *user, int sort, int writableOnly);
QUIB_API PSZLIST QuibCgiLDAPValidShareGen(const char *context, const char *user, int sort, int writableOnly);

QUIB_END_C
