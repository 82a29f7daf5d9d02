#include <stdio.h>
#include <string.h>

#include "common/log.h"
#include "common/modules.h"
#include "common/owners.h"
#include "errors/guard.h"
#include "norvo/norvodir.h"

using norvo::kNorvoDir;

char *NvoLibGetTokOfPath(const char *path, int first) {
    return norvo::Guarded<char *>(nullptr, [&]() -> char * {
        if (path == nullptr) {
            NVO_LOG(kNorvoDir, "%s(%d): bad parameter!");
            return nullptr;
        }
        norvo::SzList pieces(VLIBCSzListAlloc(1024));
        if (!pieces) {
            NVO_LOG(kNorvoDir, "%s(%d): VLIBCSzListAlloc() failed!");
            return nullptr;
        }
        if (strchr(path, '/') == nullptr) {
            NVO_LOG(kNorvoDir, "%s(%d): bad path name=%s", path);
            return nullptr;
        }
        char copy[4095] = {0};
        snprintf(copy, sizeof(copy), "%s", path);
        PSZLIST raw = pieces.release();
        VLIBCStrTok(copy, "/", &raw);
        pieces.reset(raw);
        const int count = VLIBCSzListCount(pieces.get());
        if (count <= 0) {
            NVO_LOG(kNorvoDir, "%s(%d) error path");
            return nullptr;
        }
        return strdup(VLIBCSzListGet(pieces.get(), first ? 0 : count - 1));
    });
}
