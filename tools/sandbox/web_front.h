// The web front inside an appliance: Debian's lighttpd on 127.0.0.1 with a CGI program behind
// /cgi-bin/norvo.cgi (configured by tools/cgi/lighttpd-conf.sh, as the demo's), and curl to
// ask it. For tests of everything the CGI programs serve.
#pragma once

#include <string>
#include <vector>

#include "child_process.h"

namespace norvo::testing {

class WebFront {
public:
    // Starts the server on a free port inside the current appliance (build one first) and waits
    // until it answers. trustedProxy: the one address whose X-Forwarded-For and Client-IP
    // headers pass; "" strips them from every request. Aborts when it can't start.
    explicit WebFront(const std::string &program, const std::string &trustedProxy = "");
    // Stops the server.
    ~WebFront();
    WebFront(const WebFront &) = delete;
    WebFront &operator=(const WebFront &) = delete;

    struct Reply {
        std::string head;  // status line and headers, CRLFs as sent
        std::string body;
    };
    // GET /cgi-bin/norvo.cgi?query with extra request headers ("Name: value") via curl,
    // from the given local address (127.0.0.1 when "").
    Reply Get(const std::string &query, const std::vector<std::string> &headers = {},
              const std::string &from = "") const;
    // The same as a POST of the urlencoded form.
    Reply Post(const std::string &query, const std::string &form) const;
    // A POST of body, bytes as given, with extra request headers (a Content-Type among them).
    Reply PostBody(const std::string &query, const std::string &body,
                   const std::vector<std::string> &headers) const;
    int port() const { return port_; }
    // The server's document root, empty at first: pages a test serves beside the program.
    std::string DocumentRoot() const { return dir_ + "/htdocs"; }

private:
    Reply Ask(std::vector<std::string> argv, const std::string &query) const;

    std::string dir_;
    int port_ = 0;
    internal::ChildProcess server_;
};

}  // namespace norvo::testing
