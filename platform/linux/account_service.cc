#include "account_service.h"

#include "quib_paths.h"
#include "vlibc_file.h"

namespace norvo::platform {

bool IsConfigured(const AccountService &service) {
    char name[256];
    return VLIBCFileGetKeyValue(QUIB_INFO_CONF, service.nameKey, name, sizeof name, 0) > 1 &&
           VLIBCFileCheckKeyValue(QUIB_INFO_CONF, service.enabledKey, "yes", 1) == 1;
}

}  // namespace norvo::platform
