// A CGI author's first program against the installed library.
#include <stdio.h>

#include <norvo/norvo.h>

int main() {
    if (!NvoCheckReservedName("._resource")) {
        printf("%d %s\n", NvoLibGetErr(), NvoParseErrorToOBXString(NvoLibGetErr(), nullptr));
    }
    return 0;
}
