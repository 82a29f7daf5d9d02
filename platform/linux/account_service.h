// Whether the appliance is joined to a domain or bound to a directory service. Both the
// privilege lookups and the share lists of such accounts answer only when it is.
#pragma once

#include "quib_user.h"

namespace norvo::platform {

struct AccountService {
    AUTH_TYPE kind;
    const char *nameKey;     // in /etc/quibinfo.conf, must be non-empty
    const char *enabledKey;  // must be "yes"
};

inline constexpr AccountService kDomainService = {AUTH_DOMAIN, "workgroup", "domain_joined"};
inline constexpr AccountService kDirectoryService = {AUTH_LDAP, "ldap_server", "ldap_enabled"};

bool IsConfigured(const AccountService &service);

}  // namespace norvo::platform
