#include "web_front.h"

#include <arpa/inet.h>
#include <fcntl.h>
#include <netinet/in.h>
#include <stdlib.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <time.h>
#include <unistd.h>

#include "fail.h"

namespace norvo::testing {
namespace {

// A port no one listens on now; the kernel picks it.
int FreePort() {
    const int fd = socket(AF_INET, SOCK_STREAM | SOCK_CLOEXEC, 0);
    sockaddr_in addr{};
    addr.sin_family = AF_INET;
    addr.sin_addr.s_addr = htonl(INADDR_LOOPBACK);
    socklen_t size = sizeof addr;
    if (fd < 0 || bind(fd, reinterpret_cast<sockaddr *>(&addr), sizeof addr) != 0 ||
        getsockname(fd, reinterpret_cast<sockaddr *>(&addr), &size) != 0) {
        internal::FailErrno("can't find a free port");
    }
    close(fd);
    return ntohs(addr.sin_port);
}

bool Answers(int port) {
    const int fd = socket(AF_INET, SOCK_STREAM | SOCK_CLOEXEC, 0);
    sockaddr_in addr{};
    addr.sin_family = AF_INET;
    addr.sin_port = htons(static_cast<uint16_t>(port));
    addr.sin_addr.s_addr = htonl(INADDR_LOOPBACK);
    const bool up = connect(fd, reinterpret_cast<sockaddr *>(&addr), sizeof addr) == 0;
    close(fd);
    return up;
}

// What argv writes to its stdout; aborts when it can't run or fails.
std::string Output(const std::vector<std::string> &argv) {
    int out[2];
    if (pipe2(out, O_CLOEXEC) != 0) {
        internal::FailErrno("pipe");
    }
    std::vector<char *> args;
    for (const auto &arg : argv)
        args.push_back(const_cast<char *>(arg.c_str()));
    args.push_back(nullptr);
    const pid_t pid = fork();
    if (pid == 0) {
        dup2(out[1], STDOUT_FILENO);
        execv(args[0], args.data());
        _exit(127);
    }
    close(out[1]);
    std::string text;
    char buf[65536];
    for (ssize_t got; (got = read(out[0], buf, sizeof buf)) > 0;)
        text.append(buf, static_cast<size_t>(got));
    close(out[0]);
    int status = -1;
    waitpid(pid, &status, 0);
    if (status != 0) {
        internal::Fail("%s failed (status %d)", argv[0].c_str(), status);
    }
    return text;
}

}  // namespace

WebFront::WebFront(const std::string &program, const std::string &trustedProxy) {
    char dir[] = "/tmp/webfront.XXXXXX";
    if (mkdtemp(dir) == nullptr || mkdir((std::string(dir) + "/htdocs").c_str(), 0755) != 0) {
        internal::FailErrno("can't make the web front's directory");
    }
    dir_ = dir;
    port_ = FreePort();
    const std::string conf = Output({"/bin/bash", NORVO_SOURCE_DIR "/tools/cgi/lighttpd-conf.sh", dir_,
                                     std::to_string(port_), program, trustedProxy});
    const std::string confFile = dir_ + "/lighttpd.conf";
    const int fd = open(confFile.c_str(), O_WRONLY | O_CREAT | O_TRUNC | O_CLOEXEC, 0644);
    if (fd < 0 || write(fd, conf.data(), conf.size()) != static_cast<ssize_t>(conf.size()) ||
        close(fd) != 0) {
        internal::FailErrno("can't write %s", confFile.c_str());
    }
    const std::string server = internal::FindProgram("lighttpd");
    if (server.empty()) {
        internal::Fail("lighttpd is missing (bash scripts/deps.sh installs it)");
    }
    server_ = internal::ChildProcess::Start({server, "-D", "-f", confFile});
    for (int tries = 0; !Answers(port_); ++tries) {
        int status;
        if (tries == 500 || server_.Ended(&status)) {
            internal::Fail("lighttpd did not start on port %d (see %s/error.log)", port_, dir_.c_str());
        }
        const timespec delay{0, 10 * 1000000L};
        nanosleep(&delay, nullptr);
    }
}

WebFront::~WebFront() {
    server_.Stop();
}

WebFront::Reply WebFront::Get(const std::string &query, const std::vector<std::string> &headers,
                              const std::string &from) const {
    std::vector<std::string> argv = {internal::FindProgram("curl"), "-sS", "-i", "--max-time", "30"};
    if (!from.empty()) {
        argv.insert(argv.end(), {"--interface", from});
    }
    for (const std::string &header : headers) {
        argv.insert(argv.end(), {"-H", header});
    }
    return Ask(argv, query);
}

WebFront::Reply WebFront::Post(const std::string &query, const std::string &form) const {
    return Ask({internal::FindProgram("curl"), "-sS", "-i", "--max-time", "30", "--data-raw", form}, query);
}

WebFront::Reply WebFront::PostBody(const std::string &query, const std::string &body,
                                   const std::vector<std::string> &headers) const {
    const std::string file = dir_ + "/body";
    const int fd = open(file.c_str(), O_WRONLY | O_CREAT | O_TRUNC | O_CLOEXEC, 0600);
    if (fd < 0 || write(fd, body.data(), body.size()) != static_cast<ssize_t>(body.size()) ||
        close(fd) != 0) {
        internal::FailErrno("can't write %s", file.c_str());
    }
    std::vector<std::string> argv = {
        internal::FindProgram("curl"), "-sS", "-i", "--max-time", "30", "--data-binary", "@" + file};
    for (const std::string &header : headers) {
        argv.insert(argv.end(), {"-H", header});
    }
    return Ask(argv, query);
}

WebFront::Reply WebFront::Ask(std::vector<std::string> argv, const std::string &query) const {
    argv.push_back("http://127.0.0.1:" + std::to_string(port_) + "/cgi-bin/norvo.cgi?" + query);
    const std::string text = Output(argv);
    const size_t end = text.find("\r\n\r\n");
    return end == std::string::npos ? Reply{text, ""} : Reply{text.substr(0, end + 2), text.substr(end + 4)};
}

}  // namespace norvo::testing
