// VLIBCSupportGet: the capability table, key="value" lines in QUIB_INFO_DEFAULTS_CONF, which
// the factory writes and nothing on the appliance changes (e.g. support_s2s="yes").
#include <errno.h>

#include <string>
#include <vector>

#include "api_guard.h"
#include "locked_file.h"
#include "quib_paths.h"
#include "settings_format.h"
#include "text_util.h"
#include "vlibc_support.h"

extern "C" int VLIBCSupportGet(const char *key) {
    if (key == nullptr || key[0] == '\0') {
        QUIB_SET_ERR(QUIB_ERR_BAD_PARAMETER);
        return -1;
    }
    namespace np = norvo::platform;
    return np::Guarded(-1, [&] {
        std::string text;
        if (int err = np::ReadWholeFile(QUIB_INFO_DEFAULTS_CONF, &text); err != 0) {
            // A model without a table supports nothing beyond the basics.
            if (err == ENOENT) {
                return 0;
            }
            QUIB_SET_ERR(QUIB_ERR_OPEN_FAILED);
            return -1;
        }
        const std::vector<np::SettingsLine> lines = np::ParseSettings(text);
        const np::SettingsLine *entry = np::FindSettingsEntry(lines, key, false);
        bool on = false;
        return entry != nullptr && np::ParseBool(entry->value, &on) && on ? 1 : 0;
    });
}
