// The appliance's syslog: a datagram socket at /dev/log that every process of the namespace
// (any identity) logs to, drained by a thread of its own. The thread is needed, not a
// convenience: a Unix datagram socket queues only net.unix.max_dgram_qlen messages (often 10)
// and glibc's syslog blocks when the queue is full, so an undrained capture would hang the code
// under test.
#pragma once

#include <functional>
#include <mutex>
#include <string>
#include <string_view>
#include <thread>
#include <vector>

#include "appliance.h"
#include "unique_fd.h"

namespace norvo::testing::internal {

class SyslogCapture {
public:
    // Binds the socket at path (mode 0666, so non-root children can log) and starts draining.
    explicit SyslogCapture(const std::string &path);
    // Delivers what is still queued, then stops the thread.
    ~SyslogCapture();
    SyslogCapture(const SyslogCapture &) = delete;
    SyslogCapture &operator=(const SyslogCapture &) = delete;

    // Every line received so far (including those queued at the moment of the call), in order.
    std::vector<LogLine> Lines();
    void Clear();
    // From now on lines go to sink (called on the capture's thread, one at a time) instead of
    // being kept.
    void SetSink(std::function<void(const LogLine &)> sink);

private:
    void Run();
    void DrainLocked();

    UniqueFd socket_;
    UniqueFd wake_;
    std::mutex mutex_;
    std::vector<LogLine> lines_;
    std::function<void(const LogLine &)> sink_;
    std::vector<char> buffer_ = std::vector<char>(1 << 16);  // used under mutex_
    std::thread thread_;
};

// Reads one datagram as glibc's syslog sends it: "<PRI>Mmm dd hh:mm:ss tag: message", where
// the tag is the ident with an optional "[pid]". The priority is PRI's severity (PRI & 7).
// false when the datagram is not in that form.
[[nodiscard]] bool ParseSyslogDatagram(std::string_view datagram, LogLine *line);

// Replaces the line number that follows a source module's name by "#": "name:123 ",
// "name(123)" and "name (123)" at the start of the message (the modules' log format), and the
// same after any "x.cpp", "x.cc" or "x.c" later in the message.
std::string NormaliseSourceLines(const std::string &text);

}  // namespace norvo::testing::internal
