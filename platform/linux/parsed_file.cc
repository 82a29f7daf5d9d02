#include "parsed_file.h"

#include <errno.h>
#include <fcntl.h>
#include <unistd.h>

#include "locked_file.h"

namespace norvo::platform {
namespace {

bool SameTime(const timespec &a, const timespec &b) {
    return a.tv_sec == b.tv_sec && a.tv_nsec == b.tv_nsec;
}

}  // namespace

FileVersion FileVersion::Of(const struct stat &st) {
    FileVersion version;
    version.dev = st.st_dev;
    version.ino = st.st_ino;
    version.size = st.st_size;
    version.mtime = st.st_mtim;
    version.ctime = st.st_ctim;
    return version;
}

bool FileVersion::operator==(const FileVersion &other) const {
    return dev == other.dev && ino == other.ino && size == other.size && SameTime(mtime, other.mtime) &&
           SameTime(ctime, other.ctime);
}

bool IsRacy(const FileVersion &version) {
    timespec now{};
    clock_gettime(CLOCK_REALTIME_COARSE, &now);
    // Whole-second stamps (no nanoseconds) come from file systems that keep up to two seconds'
    // granularity; otherwise a tick of the coarse clock is at most 10 ms, so 50 ms is safe.
    const bool coarse = version.mtime.tv_nsec == 0 && version.ctime.tv_nsec == 0;
    const long long windowNs = coarse ? 3'000'000'000LL : 50'000'000LL;
    const long long nowNs = static_cast<long long>(now.tv_sec) * 1'000'000'000LL + now.tv_nsec;
    for (const timespec &stamp : {version.mtime, version.ctime}) {
        const long long stampNs = static_cast<long long>(stamp.tv_sec) * 1'000'000'000LL + stamp.tv_nsec;
        if (nowNs - stampNs < windowNs) {
            return true;
        }
    }
    return false;
}

int ParsedFileBase::GetParsed(const std::function<std::shared_ptr<const void>(std::string_view)> &parse,
                              std::shared_ptr<const void> *parsed) {
    const std::lock_guard<std::mutex> hold(mutex_);
    struct stat st;
    if (stat(path_, &st) != 0) {
        return errno;
    }
    if (loaded_ && !racy_ && FileVersion::Of(st) == version_) {
        *parsed = parsed_;
        return 0;
    }
    // O_NONBLOCK so that a FIFO put in place of the file cannot hang the open.
    FileDescriptor fd(open(path_, O_RDONLY | O_CLOEXEC | O_NONBLOCK));
    if (!fd.IsOpen()) {
        return errno;
    }
    if (fstat(fd.Get(), &st) != 0) {
        return errno;
    }
    if (!S_ISREG(st.st_mode)) {
        return S_ISDIR(st.st_mode) ? EISDIR : EINVAL;
    }
    std::string text;
    if (const int err = ReadAll(fd.Get(), &text)) {
        return err;
    }
    const FileVersion version = FileVersion::Of(st);
    if (!(loaded_ && racy_ && text == text_)) {
        std::shared_ptr<const void> fresh = parse(text);
        parsed_ = std::move(fresh);
    }
    loaded_ = true;
    version_ = version;
    racy_ = IsRacy(version);
    text_ = racy_ ? std::move(text) : std::string();
    *parsed = parsed_;
    return 0;
}

}  // namespace norvo::platform
