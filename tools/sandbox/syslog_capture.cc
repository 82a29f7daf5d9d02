#include "syslog_capture.h"

#include <poll.h>
#include <pthread.h>
#include <sys/eventfd.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <sys/un.h>
#include <unistd.h>

#include <algorithm>
#include <cctype>
#include <cerrno>
#include <cstdint>
#include <cstring>
#include <future>

#include "fail.h"

namespace norvo::testing::internal {

namespace {

constexpr int kReceiveBuffer = 4 << 20;

// The capture's thread does its allocating work only while it holds this gate, and every fork
// of the process waits for it. Tests fork children that allocate: one forked while the thread
// was inside the allocator would inherit a held lock and hang at its first allocation
// (sanitizer allocators don't guard fork by themselves).
std::mutex &ForkGate() {
    static std::mutex gate;
    return gate;
}

void GuardForksWithGate() {
    static std::once_flag once;
    std::call_once(once, [] {
        if (pthread_atfork([] { ForkGate().lock(); }, [] { ForkGate().unlock(); },
                           [] { ForkGate().unlock(); }) != 0)
            Fail("can't install the fork handlers of the syslog capture");
    });
}

bool IsNameChar(char c) {
    return std::isalnum(static_cast<unsigned char>(c)) || c == '_' || c == '-';
}

bool HasSourceExtension(std::string_view name) {
    for (std::string_view extension : {".cpp", ".cc", ".c"})
        if (name.size() > extension.size() && name.substr(name.size() - extension.size()) == extension)
            return true;
    return false;
}

// When a line number follows position end (a module name just ended there), returns the
// positions of its digits.
bool LineNumberAfter(const std::string &text, size_t end, size_t *first, size_t *last) {
    size_t at = end;
    if (at < text.size() && text[at] == ':') {
        ++at;
    } else {
        if (at < text.size() && text[at] == ' ')
            ++at;
        if (at >= text.size() || text[at] != '(')
            return false;
        ++at;
    }
    size_t digits = at;
    while (digits < text.size() && std::isdigit(static_cast<unsigned char>(text[digits])))
        ++digits;
    if (digits == at)
        return false;
    if (text[at - 1] == '(' && (digits >= text.size() || text[digits] != ')'))
        return false;
    *first = at;
    *last = digits;
    return true;
}

}  // namespace

bool ParseSyslogDatagram(std::string_view datagram, LogLine *line) {
    if (datagram.size() < 3 || datagram[0] != '<')
        return false;
    size_t at = 1;
    int pri = 0;
    while (at < datagram.size() && std::isdigit(static_cast<unsigned char>(datagram[at])) && at < 5)
        pri = pri * 10 + (datagram[at++] - '0');
    if (at == 1 || at >= datagram.size() || datagram[at] != '>')
        return false;
    std::string_view rest = datagram.substr(at + 1);
    // "Mmm dd hh:mm:ss " (RFC 3164 timestamp).
    constexpr size_t kStampLength = 16;
    if (rest.size() < kStampLength || rest[3] != ' ' || rest[6] != ' ' || rest[9] != ':' || rest[12] != ':' ||
        rest[15] != ' ')
        return false;
    rest.remove_prefix(kStampLength);
    const size_t colon = rest.find(": ");
    if (colon != std::string_view::npos) {
        rest.remove_prefix(colon + 2);
    } else if (!rest.empty() && rest.back() == ':') {
        rest = {};
    }
    line->priority = pri & 7;
    line->text.assign(rest.data(), rest.size());
    return true;
}

std::string NormaliseSourceLines(const std::string &text) {
    std::string out;
    size_t copied = 0;
    for (size_t start = 0; start < text.size();) {
        if (!IsNameChar(text[start]) && text[start] != '.') {
            ++start;
            continue;
        }
        size_t end = start;
        while (end < text.size() && (IsNameChar(text[end]) || text[end] == '.'))
            ++end;
        const std::string_view name(text.data() + start, end - start);
        size_t first = 0, last = 0;
        if ((start == 0 || HasSourceExtension(name)) && LineNumberAfter(text, end, &first, &last)) {
            out.append(text, copied, first - copied);
            out += '#';
            copied = last;
        }
        start = end;
    }
    out.append(text, copied, std::string::npos);
    return out;
}

SyslogCapture::SyslogCapture(const std::string &path) {
    socket_ = UniqueFd(socket(AF_UNIX, SOCK_DGRAM | SOCK_CLOEXEC | SOCK_NONBLOCK, 0));
    if (!socket_)
        FailErrno("can't create the syslog socket");
    sockaddr_un address{};
    address.sun_family = AF_UNIX;
    if (path.size() >= sizeof address.sun_path)
        Fail("syslog path too long: %s", path.c_str());
    memcpy(address.sun_path, path.c_str(), path.size() + 1);
    unlink(path.c_str());
    if (bind(socket_.get(), reinterpret_cast<const sockaddr *>(&address), sizeof address) != 0)
        FailErrno("can't bind the syslog socket at %s", path.c_str());
    if (chmod(path.c_str(), 0666) != 0)
        FailErrno("can't open %s to every user", path.c_str());
    const int size = kReceiveBuffer;
    if (setsockopt(socket_.get(), SOL_SOCKET, SO_RCVBUFFORCE, &size, sizeof size) != 0 &&
        setsockopt(socket_.get(), SOL_SOCKET, SO_RCVBUF, &size, sizeof size) != 0)
        FailErrno("can't enlarge the syslog socket's buffer");
    wake_ = UniqueFd(eventfd(0, EFD_CLOEXEC | EFD_NONBLOCK));
    if (!wake_)
        FailErrno("can't create an eventfd");
    GuardForksWithGate();
    // Forks must not overlap the thread's own start-up either: wait until it is about to poll.
    std::promise<void> started;
    std::future<void> running = started.get_future();
    thread_ = std::thread([this, started = std::move(started)]() mutable {
        started.set_value();
        Run();
    });
    running.wait();
}

SyslogCapture::~SyslogCapture() {
    const uint64_t one = 1;
    if (write(wake_.get(), &one, sizeof one) != ssize_t(sizeof one))
        abort();
    thread_.join();
    const std::lock_guard<std::mutex> lock(mutex_);
    DrainLocked();
}

void SyslogCapture::Run() {
    for (;;) {
        pollfd fds[2] = {{socket_.get(), POLLIN, 0}, {wake_.get(), POLLIN, 0}};
        if (poll(fds, 2, -1) < 0) {
            if (errno == EINTR)
                continue;
            FailErrno("can't wait for syslog lines");
        }
        if (fds[1].revents != 0)
            return;
        const std::lock_guard<std::mutex> gate(ForkGate());
        const std::lock_guard<std::mutex> lock(mutex_);
        DrainLocked();
    }
}

void SyslogCapture::DrainLocked() {
    for (;;) {
        const ssize_t n = recv(socket_.get(), buffer_.data(), buffer_.size(), MSG_TRUNC);
        if (n < 0) {
            if (errno == EINTR)
                continue;
            if (errno == EAGAIN || errno == EWOULDBLOCK)
                return;
            FailErrno("can't read the syslog socket");
        }
        const std::string_view datagram(buffer_.data(), std::min(size_t(n), buffer_.size()));
        LogLine line{};
        if (!ParseSyslogDatagram(datagram, &line)) {
            // Kept rather than dropped, so a test sees that something unexpected was logged.
            line.priority = -1;
            line.text.assign(datagram.data(), datagram.size());
        }
        if (sink_)
            sink_(line);
        else
            lines_.push_back(std::move(line));
    }
}

std::vector<LogLine> SyslogCapture::Lines() {
    const std::lock_guard<std::mutex> lock(mutex_);
    DrainLocked();
    return lines_;
}

void SyslogCapture::Clear() {
    const std::lock_guard<std::mutex> lock(mutex_);
    DrainLocked();
    lines_.clear();
}

void SyslogCapture::SetSink(std::function<void(const LogLine &)> sink) {
    const std::lock_guard<std::mutex> lock(mutex_);
    DrainLocked();
    for (const auto &line : lines_)
        sink(line);
    lines_.clear();
    sink_ = std::move(sink);
}

}  // namespace norvo::testing::internal
