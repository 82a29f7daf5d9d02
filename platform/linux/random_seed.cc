// Salt characters for session ids.
#include <errno.h>
#include <sys/random.h>

#include "api_guard.h"
#include "quib_user.h"

char QUIBUserRandomNumMap2Seed(long num) {
    static constexpr char kSaltAlphabet[] =
        "./0123456789ABCDEFGHIJKLMNOPQRSTUVWXYZabcdefghijklmnopqrstuvwxyz";
    unsigned char noise = 0;
    ssize_t got;
    do {
        got = getrandom(&noise, 1, 0);
    } while (got < 0 && errno == EINTR);
    if (got != 1) {
        QUIB_SET_ERRNO(got < 0 ? errno : EIO);
        return '\0';
    }
    // The random byte alone decides the character (num only reshuffles it), so the result is
    // uniform over the alphabet whatever num is.
    const unsigned long mixed = (static_cast<unsigned long>(num) ^ noise) & 63u;
    return kSaltAlphabet[mixed];
}
