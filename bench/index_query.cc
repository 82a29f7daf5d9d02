// What scripts/bench-index.sh times for the indexed search: the hits of a name pattern copied
// from a volume's index into a fresh result database, as a search does it: the process is
// root with USER's effective identity, and a row is kept when USER may enter and read its
// folder (access(2) as USER, asked once per folder).
//   index_query VOLUME USER PATTERN OUTPUT.db
// Prints the number of hits.
#include <grp.h>
#include <pwd.h>
#include <stdio.h>
#include <string.h>
#include <unistd.h>

#include <string>

#include "fileidx.h"
#include "vlibc_err.h"

namespace {

struct Folder {
    std::string dir;
    int allowed = 0;
};

int MayList(const char *dir, const char *, void *arg) {
    auto *last = static_cast<Folder *>(arg);
    if (last->dir != dir) {
        last->dir = dir;
        last->allowed = access(dir, R_OK | X_OK) == 0 ? 1 : 0;
    }
    return last->allowed;
}

}  // namespace

int main(int argc, char **argv) {
    if (argc != 5) {
        fprintf(stderr, "usage: index_query VOLUME USER PATTERN OUTPUT.db\n");
        return 2;
    }
    const passwd *user = getpwnam(argv[2]);
    if (user == nullptr || initgroups(user->pw_name, user->pw_gid) != 0 || setegid(user->pw_gid) != 0 ||
        seteuid(user->pw_uid) != 0) {
        perror("index_query: becoming the user");
        return 1;
    }
    unlink(argv[4]);
    __tag_FI_SQL_COND name{};
    snprintf(name.value, sizeof name.value, "%s", argv[3]);
    name.type = FI_COND_NAME;
    name.op = FI_OP_LIKE;
    Folder last;
    const FI_TABLE_GEN_CONTEXT context{argv[4], &last, 0};
    if (FILEIDXIsIndexEnable(argv[1]) != 1 || FILEIDXDBCreate(argv[4]) != 0 ||
        FILEIDXResultGetAndTableGen(argv[1], &name, nullptr, MayList, &context) != 0) {
        fprintf(stderr, "index_query: failed, platform error 0x%04X\n", static_cast<unsigned>(VLIBCErrGet()));
        return 1;
    }
    unsigned long long hits = 0;
    FI_QUERY all{};
    if (FILEIDXCountGet(argv[4], &all, &hits) != 0) {
        return 1;
    }
    printf("%llu\n", hits);
    return 0;
}
