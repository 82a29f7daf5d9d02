// One sharing-link authorisation in a fresh process, as a CGI request pays it; whole-process
// runs (scripts/bench-login.sh) time it with hyperfine against login_floor.
//   login_once authorize   IsAuthorizedByPath of session "SESSION0000000", cookie "L"
//   login_once load        nothing: the price of starting a program that links the library
// The client's address comes from REMOTE_ADDR as usual. Exit 0 when authorised (or loaded).
#include <fcntl.h>
#include <string.h>
#include <unistd.h>

#include "norvo/norvologin.h"

int main(int argc, char **argv) {
    if (argc != 2 || strcmp(argv[1], "load") == 0) {
        return argc == 2 ? 0 : 2;
    }
    QUIB::WebCGI cgi;
    const int sink = open("/dev/null", O_WRONLY | O_CLOEXEC);
    if (cgi.Init(-1, sink) != 0) {
        return 1;
    }
    CONFIRM_POLICY policy = {15, 0};
    char user[64];
    return NorvoLogin::IsAuthorizedByPath(&cgi, "SESSION0000000", user, sizeof user, &policy,
                                          CGI_POSITION_FILE_BROWSER, "L") == 1
               ? 0
               : 1;
}
