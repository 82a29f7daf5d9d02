// The floor of a top-down walk with a name test: only the system calls the walker's callback
// can't do without. Each directory is opened relative to its parent (O_DIRECTORY|O_NOFOLLOW)
// and read with getdents64; each entry gets the one statx relative to the directory's
// descriptor that fills the callback's stat record (no final link followed, the same fields,
// birth time included); its name is tested with fnmatch; folders are walked into. Names a walk
// never shows ("@eaDir" and the like) are passed over as the walker passes them.
// With --naive: the classic walk, for comparison: chdir into each folder by
// its absolute path, opendir and readdir it, and stat each entry by its absolute path.
//   walk_floor [--naive] DIR PATTERN     prints the number of names that match
// With --icase before the rest: the pattern's letters match either case (a search's name test).
#include <dirent.h>
#include <fcntl.h>
#include <fnmatch.h>
#include <stdio.h>
#include <string.h>
#include <sys/stat.h>
#include <unistd.h>

#include <memory>
#include <string>
#include <vector>

namespace {

constexpr size_t kReadBuffer = 64 * 1024;
constexpr unsigned kFields = STATX_TYPE | STATX_MODE | STATX_UID | STATX_GID | STATX_SIZE | STATX_ATIME |
                             STATX_MTIME | STATX_CTIME | STATX_BTIME;

const char *g_pattern;
int g_flags;
long g_matches;

bool Hidden(const char *name) {
    for (const char *hidden : {".", "..", "@eaDir", "@tmp", "@sharebin", "#snapshot", ".DS_Store"}) {
        if (strcmp(name, hidden) == 0) {
            return true;
        }
    }
    return false;
}

// One read buffer per level, kept: a fresh one per directory costs page faults when free
// gives the top of the heap back and the next directory takes it again.
std::vector<std::unique_ptr<char[]>> g_buffers;

void Floor(int fd, size_t depth) {
    if (g_buffers.size() <= depth) {
        g_buffers.emplace_back(new char[kReadBuffer]);
    }
    char *const buffer = g_buffers[depth].get();
    for (;;) {
        const ssize_t got = getdents64(fd, buffer, kReadBuffer);
        if (got <= 0) {
            break;
        }
        for (ssize_t at = 0; at < got;) {
            const auto *entry = reinterpret_cast<const struct dirent64 *>(buffer + at);
            at += entry->d_reclen;
            if (Hidden(entry->d_name)) {
                continue;
            }
            struct statx st;
            if (statx(fd, entry->d_name, AT_SYMLINK_NOFOLLOW | AT_NO_AUTOMOUNT, kFields, &st) != 0) {
                continue;
            }
            if (fnmatch(g_pattern, entry->d_name, g_flags) == 0) {
                ++g_matches;
            }
            if (S_ISDIR(st.stx_mode)) {
                const int child = openat(fd, entry->d_name, O_RDONLY | O_DIRECTORY | O_NOFOLLOW | O_CLOEXEC);
                if (child >= 0) {
                    Floor(child, depth + 1);
                    close(child);
                }
            }
        }
    }
}

void Naive(const std::string &dir) {
    if (chdir(dir.c_str()) != 0) {
        return;
    }
    DIR *stream = opendir(dir.c_str());
    if (stream == nullptr) {
        return;
    }
    while (const struct dirent64 *entry = readdir64(stream)) {
        if (Hidden(entry->d_name)) {
            continue;
        }
        const std::string path = dir + "/" + entry->d_name;
        struct statx st;
        if (statx(AT_FDCWD, path.c_str(), AT_SYMLINK_NOFOLLOW | AT_NO_AUTOMOUNT, kFields, &st) != 0) {
            continue;
        }
        if (fnmatch(g_pattern, entry->d_name, g_flags) == 0) {
            ++g_matches;
        }
        if (S_ISDIR(st.stx_mode)) {
            Naive(path);
        }
    }
    closedir(stream);
}

}  // namespace

int main(int argc, char **argv) {
    if (argc > 1 && strcmp(argv[1], "--icase") == 0) {
        g_flags = FNM_CASEFOLD;
        --argc;
        ++argv;
    }
    const bool naive = argc == 4 && strcmp(argv[1], "--naive") == 0;
    if (argc != 3 + (naive ? 1 : 0)) {
        fprintf(stderr, "usage: walk_floor [--naive] DIR PATTERN\n");
        return 2;
    }
    const char *dir = argv[argc - 2];
    g_pattern = argv[argc - 1];
    if (naive) {
        Naive(dir);
    } else {
        const int fd = open(dir, O_RDONLY | O_DIRECTORY | O_NOFOLLOW | O_CLOEXEC);
        if (fd < 0) {
            perror(dir);
            return 1;
        }
        Floor(fd, 0);
        close(fd);
    }
    printf("%ld\n", g_matches);
    return 0;
}
