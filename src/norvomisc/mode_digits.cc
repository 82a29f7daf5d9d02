#include <string>

#include "errors/guard.h"
#include "norvo/norvomisc.h"

namespace {

int Triple(bool r, bool w, bool x) {
    return (r ? 4 : 0) + (w ? 2 : 0) + (x ? 1 : 0);
}

}  // namespace

// Not checked for length: the caller hands a nine-character string.
int GetPrivilege(const char *s) {
    const auto digit = [s](int at) { return Triple(s[at] == 'r', s[at + 1] == 'w', s[at + 2] == 'x'); };
    return digit(0) * 100 + digit(3) * 10 + digit(6);
}

int GetPrivilege(unsigned int mode) {
    const auto digit = [mode](unsigned shift) {
        return Triple(mode & (04u << shift), mode & (02u << shift), mode & (01u << shift));
    };
    return digit(6) * 100 + digit(3) * 10 + digit(0);
}

std::string GetPrivilegeStr(unsigned int mode) {
    return norvo::Guarded<std::string>(std::string(), [&]() -> std::string {
        static const char kLetters[] = "rwxrwxrwx";
        std::string out(9, '-');
        for (unsigned i = 0; i < 9; ++i) {
            if (mode & (0400u >> i)) {
                out[i] = kLetters[i];
            }
        }
        return out;
    });
}
