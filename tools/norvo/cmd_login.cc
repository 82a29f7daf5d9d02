// login: a login record made the way the web interface makes one, so callers get a real sid.
#include <stdio.h>

#include <string>

#include "exit_status.h"
#include "handlers.h"
#include "norvo/errors.h"
#include "output.h"
#include "quib_login.h"
#include "vlibc_err.h"

namespace norvo::cli {
namespace {

constexpr size_t kLongestPassword = 4096;
constexpr char kDefaultRemoteAddr[] = "127.0.0.1";

// The first line of stdin without its line ending; false when there is none or it is too long.
bool ReadPasswordLine(std::string *password, std::string *error) {
    password->clear();
    int c = 0;
    while ((c = getchar()) != EOF && c != '\n') {
        if (password->size() >= kLongestPassword) {
            *error = "the password on stdin is longer than 4096 bytes";
            return false;
        }
        if (c == '\0') {
            *error = "the password on stdin holds a NUL byte";
            return false;
        }
        password->push_back(static_cast<char>(c));
    }
    if (!password->empty() && password->back() == '\r') {
        password->pop_back();
    }
    if (password->empty()) {
        *error = "no password on stdin";
        return false;
    }
    return true;
}

// The library code for a refused login: the platform's own codes, with an unknown account
// reported as such.
int LoginErrorCode(int quibErr) {
    return quibErr == QUIB_ERR_NO_SUCH_USER ? NVO_ERR_NO_USER : NvoParseQuibErrToError(quibErr, nullptr);
}

std::string LoginErrorMessage(int quibErr) {
    char hex[16];
    snprintf(hex, sizeof(hex), "0x%04X", static_cast<unsigned>(quibErr));
    switch (quibErr) {
        case QUIB_ERR_NO_SUCH_USER:
            return std::string("login refused: no such account (platform ") + hex + ")";
        case QUIB_ERR_ACCESS_DENIED:
            return std::string("login refused: wrong password or expired account (platform ") + hex + ")";
        default:
            return std::string("login failed (platform ") + hex + ")";
    }
}

}  // namespace

int RunLogin(const Invocation &inv) {
    const std::string &user = *inv.Value("user");
    const bool fromStdin = inv.Has("password-stdin");
    if (fromStdin == inv.Has("password")) {
        return ReportUsageError(inv.command, "give exactly one of --password and --password-stdin");
    }
    std::string password;
    if (fromStdin) {
        std::string error;
        if (!ReadPasswordLine(&password, &error)) {
            return ReportUsageError(inv.command, error);
        }
    } else {
        password = *inv.Value("password");
    }
    const char *remoteAddr = inv.Has("remote-addr") ? inv.CStr("remote-addr") : kDefaultRemoteAddr;

    char sid[256] = {0};
    if (QUIBLoginCreate(user.c_str(), password.c_str(), remoteAddr, sid, static_cast<int>(sizeof(sid))) !=
        0) {
        const int quibErr = VLIBCErrGet();
        return ReportFailure(inv, LoginErrorCode(quibErr), LoginErrorMessage(quibErr));
    }

    Json::Value data(Json::objectValue);
    data["user"] = user;
    data["sid"] = sid;
    data["remote_addr"] = remoteAddr;
    TextTable text;
    text.Line(sid);  // the sid alone, so scripts can take it with $(...)
    return ReportSuccess(inv, data, text);
}

}  // namespace norvo::cli
