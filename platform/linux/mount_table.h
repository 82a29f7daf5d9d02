// The kernel's mount table of this process, and the file-system type index of each mount.
#pragma once
#include <string>
#include <string_view>
#include <vector>

namespace norvo::platform {

struct MountEntry {
    std::string source;  // device or fsname, unescaped
    std::string dir;     // mount directory, unescaped
    std::string type;    // "ext4", "fuse.sshfs", ...
};

// Decodes the three-digit octal escapes that the kernel writes for space, tab, newline,
// backslash and '#'. A backslash not followed by three octal digits stays as it is.
[[nodiscard]] std::string UnescapeMountField(std::string_view field);

// Splits one line of /proc/self/mounts. false for a line with fewer than three fields.
[[nodiscard]] bool ParseMountLine(std::string_view line, MountEntry *entry);

// Reads /proc/self/mounts in kernel order. 0 and *entries, or the errno.
[[nodiscard]] int ReadMountTable(std::vector<MountEntry> *entries);

// Which mounts a lookup considers: all, or the data mounts only (those whose directory is a
// volume or lies below one; the system disk and the host's other mounts are not data).
enum class MountScope { kAll, kDataVolumes };

// The entry holding the normalised absolute path: the deepest mount directory in scope that is
// the path or a parent of it by whole components; of mounts stacked on one directory the last
// (the one visible). null when none holds it.
[[nodiscard]] const MountEntry *FindHoldingMount(const std::vector<MountEntry> &entries,
                                                 std::string_view path, MountScope scope);

// FSTYPE_* index of a mount type name, with the source for FUSE mounts that carry no subtype.
[[nodiscard]] int FsTypeIndexOf(std::string_view type, std::string_view source);

// FSTYPE_* index of a statfs f_type magic; FSTYPE_UNKNOWN when the magic does not tell.
[[nodiscard]] int FsTypeIndexOfMagic(long magic);

}  // namespace norvo::platform
