#include <errno.h>
#include <stdio.h>
#include <string.h>
#include <sys/stat.h>
#include <unistd.h>

#include "common/log.h"
#include "common/modules.h"
#include "common/text.h"
#include "errors/guard.h"
#include "norvo/nvoman.h"

using norvo::kNvoMan;

int NvoCreateTmpDir(const char *volume) {
    return norvo::Guarded<int>(-1, [&]() -> int {
        if (norvo::IsEmpty(volume)) {
            NVO_LOG(kNvoMan, "%s(%d) Bad Parameter");
            return -1;
        }
        char tmp[4096] = {0};
        char scratch[4096] = {0};
        snprintf(tmp, 4095, "%s/@tmp", volume);
        snprintf(scratch, 4095, "%s/@tmp/norvo", volume);
        for (const char *dir : {tmp, scratch}) {
            struct stat st;
            // Whatever already stands there is left alone, even a plain file.
            if (stat(dir, &st) == 0) {
                continue;
            }
            unlink(dir);  // a dangling link would make mkdir fail
            umask(0);     // every user's search writes below it
            if (mkdir(dir, 0777) != 0) {
                const int err = errno;
                NVO_LOG(kNvoMan, "%s(%d)Failed to mkdir : %s , reason=%s[%d]", dir, strerror(err), err);
                return -1;
            }
        }
        return 0;
    });
}
