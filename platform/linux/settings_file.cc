// VLIBCFile*: the appliance's key="value" settings files. Writers hold an exclusive lock and
// replace the file by rename, so a reader needs no lock: it sees the old text or the new, never
// a mixture.
#include <ctype.h>
#include <dirent.h>
#include <errno.h>
#include <fcntl.h>
#include <limits.h>
#include <stdlib.h>
#include <string.h>
#include <sys/file.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <chrono>
#include <functional>
#include <memory>
#include <set>
#include <string>
#include <vector>

#include "api_guard.h"
#include "locked_file.h"
#include "settings_format.h"
#include "szhash.h"
#include "text_util.h"
#include "vlibc_file.h"

namespace norvo::platform {
namespace {

using Lines = std::vector<SettingsLine>;

// How long a writer keeps reopening a file that other writers replace while it waits for the
// lock. Each reopen means another writer finished, so this only bounds starvation.
constexpr auto kMaxLockWait = std::chrono::seconds(10);

// The error slot for bad arguments: 0x0D00, or 0xC300 for a path longer than PATH_MAX.
bool CheckFileArg(const char *file) {
    if (file == nullptr || file[0] == '\0') {
        QUIB_SET_ERR(QUIB_ERR_BAD_PARAMETER);
        return false;
    }
    if (strnlen(file, PATH_MAX) >= PATH_MAX) {
        QUIB_SET_ERR(QUIB_ERR_NAME_TOO_LONG);
        return false;
    }
    return true;
}

// Keys a reader may ask for: anything a line could hold as a key.
bool IsReadableKey(const char *key) {
    if (key == nullptr || key[0] == '\0') {
        return false;
    }
    size_t len = strnlen(key, kMaxSettingsKeyLength + 1);
    if (len > kMaxSettingsKeyLength) {
        return false;
    }
    std::string_view view(key, len);
    for (char c : view) {
        if (static_cast<unsigned char>(c) < 0x20 || c == '=') {
            return false;
        }
    }
    return IsValidUtf8(view) && TrimSpace(view).size() == len;
}

// What every reader does around its own work: reads and parses file (no lock: see above) and
// returns read(lines), all under Guarded; -1 with 0x0900 when the file can't be read.
template <typename Read>
int ReadSettings(const char *file, Read read) {
    return Guarded(-1, [&] {
        std::string text;
        if (ReadWholeFile(file, &text) != 0) {
            QUIB_SET_ERR(QUIB_ERR_OPEN_FAILED);
            return -1;
        }
        const Lines lines = ParseSettings(text);
        return read(lines);
    });
}

// The file a writer replaces: the target of a symbolic link, so the link survives.
std::string WriteTarget(const char *file) {
    struct stat st;
    if (lstat(file, &st) == 0 && S_ISLNK(st.st_mode)) {
        if (char *real = realpath(file, nullptr); real != nullptr) {
            std::string target(real);
            free(real);
            return target;
        }
    }
    return file;
}

int WriteAll(int fd, const std::string &text) {
    size_t done = 0;
    while (done < text.size()) {
        ssize_t n = write(fd, text.data() + done, text.size() - done);
        if (n < 0) {
            if (errno == EINTR) {
                continue;
            }
            return errno;
        }
        done += static_cast<size_t>(n);
    }
    return 0;
}

// The locked, current file a writer works on.
struct LockedTarget {
    FileDescriptor fd;
    struct stat st {};
    bool created = false;
};

// Opens target and takes the exclusive lock, creating the file (0644) when create is set.
// A writer that waited while another replaced the file reopens it, so no update is lost.
int LockTarget(const std::string &target, bool create, LockedTarget *out) {
    const auto deadline = std::chrono::steady_clock::now() + kMaxLockWait;
    while (std::chrono::steady_clock::now() < deadline) {
        FileDescriptor fd(open(target.c_str(), O_RDWR | O_CLOEXEC | O_NONBLOCK));
        bool created = false;
        if (!fd.IsOpen()) {
            if (errno != ENOENT || !create) {
                return errno;
            }
            fd.Reset(open(target.c_str(), O_RDWR | O_CREAT | O_EXCL | O_CLOEXEC, 0644));
            if (!fd.IsOpen()) {
                if (errno == EEXIST) {
                    continue;
                }
                return errno;
            }
            created = true;
        }
        struct stat st;
        if (fstat(fd.Get(), &st) != 0) {
            return errno;
        }
        if (!S_ISREG(st.st_mode)) {
            return S_ISDIR(st.st_mode) ? EISDIR : EINVAL;
        }
        // A process lock, not flock: a caller may hold the file's flock around its writes
        // (the sharing privileges do), and a second flock of ours would wait for it forever.
        if (int err = LockFileForProcess(fd.Get()); err != 0) {
            return err;
        }
        struct stat now;
        if (stat(target.c_str(), &now) != 0 || now.st_dev != st.st_dev || now.st_ino != st.st_ino) {
            continue;  // replaced while we waited
        }
        out->fd = std::move(fd);
        out->st = st;
        out->created = created;
        return 0;
    }
    return EAGAIN;
}

// The directory and name of target, and the name pattern of its temporaries: "." + name +
// "." + the six letters or digits mkostemp puts for XXXXXX.
struct TargetPlace {
    std::string dir;
    std::string base;
    explicit TargetPlace(const std::string &target) {
        const size_t slash = target.rfind('/');
        dir = slash == std::string::npos ? "." : (slash == 0 ? "/" : target.substr(0, slash));
        base = slash == std::string::npos ? target : target.substr(slash + 1);
    }
    std::string TempPattern() const { return (dir == "/" ? "" : dir) + "/." + base + ".XXXXXX"; }
    bool IsTempName(std::string_view name) const {
        const std::string prefix = "." + base + ".";
        if (name.size() != prefix.size() + 6 || name.substr(0, prefix.size()) != prefix) {
            return false;
        }
        return std::all_of(name.begin() + prefix.size(), name.end(),
                           [](char c) { return isascii(c) && isalnum(c); });
    }
};

// Removes the temporaries of writers that died before their rename (kill -9). Called with
// the exclusive lock on the current file, when no live writer of target can have one: a
// writer makes its temporary only while it holds the lock on the then-current file, and its
// rename, which makes another file current, consumes the temporary. So every regular file of
// the pattern is a leftover. Best effort: a leftover that can't be removed harms nobody.
void RemoveLeftoverTemps(const TargetPlace &place) {
    std::unique_ptr<DIR, int (*)(DIR *)> dir(opendir(place.dir.c_str()), closedir);
    if (!dir) {
        return;
    }
    while (const struct dirent *entry = readdir(dir.get())) {
        struct stat st;
        if (place.IsTempName(entry->d_name) &&
            fstatat(dirfd(dir.get()), entry->d_name, &st, AT_SYMLINK_NOFOLLOW) == 0 && S_ISREG(st.st_mode)) {
            (void)unlinkat(dirfd(dir.get()), entry->d_name, 0);
        }
    }
}

// Writes text to a temporary beside target with the old file's owner and mode (0644 for a
// new file), then renames it over target. 0 or the errno; the temporary never remains.
int ReplaceFile(const std::string &target, const LockedTarget &locked, const std::string &text) {
    const TargetPlace place(target);
    std::string temp = place.TempPattern();
    FileDescriptor fd(mkostemp(temp.data(), O_CLOEXEC));
    if (!fd.IsOpen()) {
        return errno;
    }
    ScopeExit removeTemp([&temp] { unlink(temp.c_str()); });
    int err = WriteAll(fd.Get(), text);
    struct stat mine;
    if (err == 0 && fstat(fd.Get(), &mine) != 0) {
        err = errno;
    }
    // Owner before mode: chown clears set-id bits. Not being able to keep the owner is a
    // failure, not a silent change of who owns the settings.
    if (err == 0 && !locked.created && (mine.st_uid != locked.st.st_uid || mine.st_gid != locked.st.st_gid) &&
        fchown(fd.Get(), locked.st.st_uid, locked.st.st_gid) != 0) {
        err = errno;
    }
    mode_t mode = locked.created ? 0644 : (locked.st.st_mode & 07777);
    if (err == 0 && fchmod(fd.Get(), mode) != 0) {
        err = errno;
    }
    if (err == 0 && fsync(fd.Get()) != 0) {
        err = errno;
    }
    if (err == 0 && rename(temp.c_str(), target.c_str()) != 0) {
        err = errno;
    }
    if (err != 0) {
        return err;
    }
    removeTemp.Dismiss();
    // Best effort: the rename is already visible; this only hardens it against power loss.
    FileDescriptor dirFd(open(place.dir.c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC));
    if (dirFd.IsOpen()) {
        (void)fsync(dirFd.Get());
    }
    return 0;
}

// The one place where writer failures reach the error slot.
void SetWriteError(int err, bool missingMeansOpenFailed) {
    if (err == ENOENT && missingMeansOpenFailed) {
        QUIB_SET_ERR(QUIB_ERR_OPEN_FAILED);
    } else {
        QUIB_SET_ERRNO(err);
    }
}

// Locks file, lets edit change its lines and replaces the file when edit reports a change.
// 0 on success, -1 with the slot set.
int Rewrite(const char *file, bool create, const std::function<bool(Lines *)> &edit) {
    std::string target = WriteTarget(file);
    LockedTarget locked;
    if (int err = LockTarget(target, create, &locked); err != 0) {
        SetWriteError(err, !create);
        return -1;
    }
    RemoveLeftoverTemps(TargetPlace(target));
    std::string text;
    int err = ReadAll(locked.fd.Get(), &text);
    if (err == 0) {
        Lines lines = ParseSettings(text);
        if (edit(&lines)) {
            err = ReplaceFile(target, locked, RenderSettings(lines));
        }
    }
    if (err != 0) {
        if (locked.created) {
            // Still under our lock: a writer waiting on it sees the file gone and starts over.
            unlink(target.c_str());
        }
        SetWriteError(err, false);
        return -1;
    }
    return 0;
}

// The line ending new lines get: the file's own (CRLF files stay CRLF).
std::string LineEnding(const Lines &lines) {
    for (const SettingsLine &line : lines) {
        if (!line.eol.empty()) {
            return line.eol;
        }
    }
    return "\n";
}

bool SetEntry(Lines *lines, const std::string &key, const std::string &value, int format) {
    std::string text = FormatEntry(key, value, format);
    bool found = false;
    bool changed = false;
    for (auto it = lines->begin(); it != lines->end();) {
        if (!KeyMatches(*it, key, false)) {
            ++it;
            continue;
        }
        if (found) {
            // A later duplicate would disagree with the value just set.
            it = lines->erase(it);
            changed = true;
            continue;
        }
        found = true;
        if (it->text != text) {
            it->text = text;
            it->value = value;
            changed = true;
        }
        ++it;
    }
    if (!found) {
        std::string eol = LineEnding(*lines);
        if (!lines->empty() && lines->back().eol.empty()) {
            lines->back().eol = eol;
        }
        SettingsLine line;
        line.text = text;
        line.eol = eol;
        line.isEntry = true;
        line.key = key;
        line.value = value;
        lines->push_back(std::move(line));
        changed = true;
    }
    return changed;
}

bool RemoveEntries(Lines *lines, const std::string &key) {
    size_t before = lines->size();
    for (auto it = lines->begin(); it != lines->end();) {
        it = KeyMatches(*it, key, false) ? lines->erase(it) : it + 1;
    }
    return lines->size() != before;
}

void TruncateList(SZLIST *list, int count) {
    while (list->nItem > count) {
        free(list->pszItem[--list->nItem]);
    }
}

}  // namespace
}  // namespace norvo::platform

using norvo::platform::Guarded;
namespace np = norvo::platform;

extern "C" {

int VLIBCFileGetKeyValue(const char *file, const char *key, char *buf, size_t size, int flags) {
    if (!np::CheckFileArg(file)) {
        return -1;
    }
    if (!np::IsReadableKey(key) || (flags != 0 && flags != 1) || (buf == nullptr && size != 0)) {
        QUIB_SET_ERR(QUIB_ERR_BAD_PARAMETER);
        return -1;
    }
    return np::ReadSettings(file, [&](const np::Lines &lines) {
        const np::SettingsLine *entry = np::FindSettingsEntry(lines, key, flags == 1);
        if (entry == nullptr) {
            QUIB_SET_ERR(QUIB_ERR_OPEN_FAILED);
            return 0;
        }
        if (size > 0) {
            size_t n = entry->value.size() < size - 1 ? entry->value.size() : size - 1;
            memcpy(buf, entry->value.data(), n);
            buf[n] = '\0';
        }
        return static_cast<int>(entry->value.size() + 1);
    });
}

int VLIBCFileSetKeyValue(const char *file, const char *key, const char *value, int format) {
    if (!np::CheckFileArg(file)) {
        return -1;
    }
    if (key == nullptr || value == nullptr || (format != 0 && format != 1) || !np::IsWritableKey(key) ||
        !np::IsWritableValue(std::string_view(value, strnlen(value, np::kMaxSettingsValueLength + 1)),
                             format)) {
        QUIB_SET_ERR(QUIB_ERR_BAD_PARAMETER);
        return -1;
    }
    return Guarded(-1, [&] {
        std::string k(key);
        std::string v(value);
        return np::Rewrite(file, true, [&](np::Lines *lines) { return np::SetEntry(lines, k, v, format); });
    });
}

int VLIBCFileRemoveKey(const char *file, const char *key) {
    if (!np::CheckFileArg(file)) {
        return -1;
    }
    if (!np::IsReadableKey(key)) {
        QUIB_SET_ERR(QUIB_ERR_BAD_PARAMETER);
        return -1;
    }
    return Guarded(-1, [&] {
        std::string k(key);
        return np::Rewrite(file, false, [&](np::Lines *lines) { return np::RemoveEntries(lines, k); });
    });
}

int VLIBCFileCheckKeyValue(const char *file, const char *key, const char *value, int flags) {
    if (!np::CheckFileArg(file)) {
        return -1;
    }
    if (!np::IsReadableKey(key) || value == nullptr || (flags != 0 && flags != 1)) {
        QUIB_SET_ERR(QUIB_ERR_BAD_PARAMETER);
        return -1;
    }
    return np::ReadSettings(file, [&](const np::Lines &lines) {
        const np::SettingsLine *entry = np::FindSettingsEntry(lines, key, flags == 1);
        if (entry == nullptr) {
            return 0;
        }
        bool same = flags == 1 ? np::EqualsIgnoreCase(entry->value, value) : entry->value == value;
        return same ? 1 : 0;
    });
}

int VLIBCFileGetKeys(const char *file, PSZLIST *keys, PSZLIST *values) {
    if (!np::CheckFileArg(file)) {
        return -1;
    }
    if (keys == nullptr || *keys == nullptr || (values != nullptr && *values == nullptr)) {
        QUIB_SET_ERR(QUIB_ERR_BAD_PARAMETER);
        return -1;
    }
    return np::ReadSettings(file, [&](const np::Lines &lines) {
        int keysBefore = VLIBCSzListCount(*keys);
        int valuesBefore = values != nullptr ? VLIBCSzListCount(*values) : 0;
        std::set<std::string> seen;
        int count = 0;
        for (const np::SettingsLine &line : lines) {
            if (!line.isEntry || !seen.insert(line.key).second) {
                continue;  // the first occurrence is the one readers see
            }
            if (VLIBCSzListPush(keys, line.key.c_str()) != 0 ||
                (values != nullptr && VLIBCSzListPush(values, line.value.c_str()) != 0)) {
                np::TruncateList(*keys, keysBefore);
                if (values != nullptr) {
                    np::TruncateList(*values, valuesBefore);
                }
                return -1;
            }
            ++count;
        }
        return count;
    });
}

}  // extern "C"

int VLIBCFileGetKeys(const char *file, int flags, PSZHASH hash, const char *separator) {
    if (!np::CheckFileArg(file)) {
        return -1;
    }
    if (flags != 0 || hash == nullptr || separator == nullptr || strcmp(separator, "=") != 0) {
        QUIB_SET_ERR(QUIB_ERR_BAD_PARAMETER);
        return -1;
    }
    return np::ReadSettings(file, [&](const np::Lines &lines) {
        // Filled aside and swapped in, so a failure leaves the caller's hash as it was.
        SZHASH filled = *hash;
        std::set<std::string> seen;
        for (const np::SettingsLine &line : lines) {
            if (line.isEntry && seen.insert(line.key).second) {
                filled.Set(line.key, line.value);
            }
        }
        std::swap(*hash, filled);
        return static_cast<int>(seen.size());
    });
}
