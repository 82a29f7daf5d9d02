// Reading /proc/self/mounts.
#include "mount_table.h"

#include <errno.h>
#include <stdio.h>
#include <stdlib.h>

#include <memory>

#include "volume_name.h"

namespace norvo::platform {
namespace {

bool IsOctalDigit(char c) {
    return c >= '0' && c <= '7';
}

struct FileCloser {
    void operator()(FILE *file) const { fclose(file); }
};

// The line buffer getline grows; freed once, whatever way the read ends.
struct LineBuffer {
    char *data = nullptr;
    size_t capacity = 0;
    LineBuffer() = default;
    LineBuffer(const LineBuffer &) = delete;
    LineBuffer &operator=(const LineBuffer &) = delete;
    ~LineBuffer() { free(data); }
};

// true when dir is path or a parent of it, comparing whole components.
bool DirHolds(std::string_view dir, std::string_view path) {
    if (dir == "/") {
        return !path.empty() && path.front() == '/';
    }
    if (path.size() < dir.size() || path.compare(0, dir.size(), dir) != 0) {
        return false;
    }
    return path.size() == dir.size() || path[dir.size()] == '/';
}

}  // namespace

std::string UnescapeMountField(std::string_view field) {
    std::string out;
    out.reserve(field.size());
    for (size_t i = 0; i < field.size(); ++i) {
        if (field[i] == '\\' && i + 3 < field.size() && IsOctalDigit(field[i + 1]) &&
            IsOctalDigit(field[i + 2]) && IsOctalDigit(field[i + 3])) {
            const int value = (field[i + 1] - '0') * 64 + (field[i + 2] - '0') * 8 + (field[i + 3] - '0');
            if (value <= 0xFF) {
                out += static_cast<char>(value);
                i += 3;
                continue;
            }
        }
        out += field[i];
    }
    return out;
}

bool ParseMountLine(std::string_view line, MountEntry *entry) {
    std::string_view fields[3];
    size_t count = 0;
    size_t pos = 0;
    while (count < 3 && pos < line.size()) {
        while (pos < line.size() && (line[pos] == ' ' || line[pos] == '\t')) {
            ++pos;
        }
        size_t end = pos;
        while (end < line.size() && line[end] != ' ' && line[end] != '\t' && line[end] != '\n') {
            ++end;
        }
        if (end > pos) {
            fields[count++] = line.substr(pos, end - pos);
        }
        pos = end;
    }
    if (count < 3) {
        return false;
    }
    entry->source = UnescapeMountField(fields[0]);
    entry->dir = UnescapeMountField(fields[1]);
    entry->type = UnescapeMountField(fields[2]);
    return true;
}

// Not getmntent: glibc decodes only \040, \011, \012 and \134, while the kernel also escapes
// '#' (\043); decoding some escapes and then the rest would decode a real backslash twice.
int ReadMountTable(std::vector<MountEntry> *entries) {
    std::unique_ptr<FILE, FileCloser> file(fopen("/proc/self/mounts", "re"));
    if (!file) {
        return errno;
    }
    entries->clear();
    LineBuffer line;
    ssize_t length;
    while ((length = getline(&line.data, &line.capacity, file.get())) >= 0) {
        MountEntry entry;
        if (ParseMountLine(std::string_view(line.data, static_cast<size_t>(length)), &entry)) {
            entries->push_back(std::move(entry));
        }
    }
    if (ferror(file.get())) {
        return errno != 0 ? errno : EIO;
    }
    return 0;
}

const MountEntry *FindHoldingMount(const std::vector<MountEntry> &entries, std::string_view path,
                                   MountScope scope) {
    const MountEntry *best = nullptr;
    size_t volumeLength = 0;
    for (const MountEntry &entry : entries) {
        if (scope == MountScope::kDataVolumes && VolumeKindOf(entry.dir, &volumeLength) == 0) {
            continue;
        }
        if (DirHolds(entry.dir, path) && (best == nullptr || entry.dir.size() >= best->dir.size())) {
            best = &entry;
        }
    }
    return best;
}

}  // namespace norvo::platform
