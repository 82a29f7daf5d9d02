// The matcher lives in the platform (VLIBCUnicodeUTF8LikeMatch), which the file index's SQL LIKE
// also uses, so the in-memory test of a name and the database's can never disagree.
#include "norvo/norvomisc.h"
#include "vlibc_unicode.h"

int NvoLibStrLikeCompare(const char *pattern, const char *subject, int esc) {
    return VLIBCUnicodeUTF8LikeMatch(pattern, subject, esc);
}
