// QUIBS2SIsSyncedShare: the per-share "synced" key of QUIB_SHARE_CONF. Nothing on ordinary
// Linux synchronises shares; the key records that the appliance's sync service was set up for
// the share, and is all this call reports.
#include <memory>

#include "api_guard.h"
#include "quib_s2s.h"
#include "share_config.h"
#include "text_util.h"

extern "C" int QUIBS2SIsSyncedShare(const char *name) {
    if (name == nullptr || name[0] == '\0') {
        QUIB_SET_ERR(QUIB_ERR_BAD_PARAMETER);
        return -1;
    }
    namespace np = norvo::platform;
    return np::Guarded(-1, [&] {
        std::shared_ptr<const np::ShareTable> table;
        if (np::CurrentShares(&table) != 0) {
            QUIB_SET_ERR(QUIB_ERR_OPEN_FAILED);
            return -1;
        }
        if (const np::ShareEntry *share = table->Find(name)) {
            return share->synced ? 1 : 0;
        }
        QUIB_SET_ERR(QUIB_ERR_NO_SUCH_SHARE);
        return -1;
    });
}
