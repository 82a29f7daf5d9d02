// Configuration files parsed once per process and again only when they change. A listing asks
// about every share in turn; reading and parsing the whole file for each made it quadratic.
#pragma once
#include <sys/stat.h>
#include <time.h>

#include <functional>
#include <memory>
#include <mutex>
#include <string>
#include <string_view>

namespace norvo::platform {

// What tells one version of a file from another without reading it.
struct FileVersion {
    dev_t dev = 0;
    ino_t ino = 0;
    off_t size = 0;
    timespec mtime{};
    timespec ctime{};

    static FileVersion Of(const struct stat &st);
    bool operator==(const FileVersion &other) const;
};

// True when a rewrite of the same size could still leave version's timestamps as they are:
// the kernel stamps files with a clock that advances in ticks (and some file systems keep
// whole seconds only), so a file changed within the current tick is compared by content.
[[nodiscard]] bool IsRacy(const FileVersion &version);

// The parsed form of one file (a regular file, read whole without a lock, as ReadWholeFile).
// Get returns the same object while the file's version stays the same and is not racy; a
// racy version is read again and parsed again only when its text differs. Readers keep what
// they got for as long as they like (a snapshot).
class ParsedFileBase {
public:
    explicit ParsedFileBase(const char *path) : path_(path) {}
    ParsedFileBase(const ParsedFileBase &) = delete;
    ParsedFileBase &operator=(const ParsedFileBase &) = delete;

protected:
    // 0 and *parsed, or the errno of the read (ENOENT when missing).
    int GetParsed(const std::function<std::shared_ptr<const void>(std::string_view)> &parse,
                  std::shared_ptr<const void> *parsed);

private:
    const char *path_;
    std::mutex mutex_;
    bool loaded_ = false;
    bool racy_ = false;
    FileVersion version_;
    std::string text_;  // kept only while racy
    std::shared_ptr<const void> parsed_;
};

template <typename T>
class ParsedFile : public ParsedFileBase {
public:
    ParsedFile(const char *path, T (*parse)(std::string_view)) : ParsedFileBase(path), parse_(parse) {}

    [[nodiscard]] int Get(std::shared_ptr<const T> *out) {
        std::shared_ptr<const void> parsed;
        const int err = GetParsed(
            [this](std::string_view text) {
                return std::shared_ptr<const void>(std::make_shared<const T>(parse_(text)));
            },
            &parsed);
        if (err == 0) {
            *out = std::static_pointer_cast<const T>(parsed);
        }
        return err;
    }

private:
    T (*parse_)(std::string_view);
};

}  // namespace norvo::platform
