// Descriptors that close themselves, and the whole-file reads of the appliance's settings
// readers.
#pragma once
#include <string>

namespace norvo::platform {

// Owns one file descriptor; closes it on destruction.
class FileDescriptor {
public:
    FileDescriptor() = default;
    explicit FileDescriptor(int fd) : fd_(fd) {}
    ~FileDescriptor() { Reset(); }
    FileDescriptor(FileDescriptor &&other) noexcept : fd_(other.Release()) {}
    FileDescriptor &operator=(FileDescriptor &&other) noexcept;
    FileDescriptor(const FileDescriptor &) = delete;
    FileDescriptor &operator=(const FileDescriptor &) = delete;

    [[nodiscard]] int Get() const { return fd_; }
    [[nodiscard]] bool IsOpen() const { return fd_ >= 0; }
    int Release();
    void Reset(int fd = -1);

private:
    int fd_ = -1;
};

// Larger files are refused (EFBIG): settings files are small, and a device or a runaway file
// must not exhaust the CGI's memory.
inline constexpr size_t kMaxSettingsFileSize = 64u << 20;

// flock that retries when a signal interrupts the wait. 0 or the errno.
[[nodiscard]] int LockFile(int fd, int operation);

// An exclusive POSIX record lock on the whole file, waiting for it (signals retried): the
// lock settings writers take. It belongs to the process, so a process that holds the file's
// flock (a different kind of lock on Linux) can still write through the writer, and two
// processes exclude each other. fd must be open for writing. Closing any descriptor of the
// file releases it. 0 or the errno.
[[nodiscard]] int LockFileForProcess(int fd);

// Reads the rest of fd. 0 and *text, or the errno (EFBIG past kMaxSettingsFileSize).
[[nodiscard]] int ReadAll(int fd, std::string *text);

// Reads the whole regular file. No lock: writers replace the file by rename, so a reader always
// sees one whole version, and readers can never starve a writer of its exclusive lock (flock
// grants new shared locks while a writer waits). 0 and *text, or the errno: ENOENT when it is
// missing, EISDIR or EINVAL when it is not a regular file.
[[nodiscard]] int ReadWholeFile(const char *path, std::string *text);

}  // namespace norvo::platform
