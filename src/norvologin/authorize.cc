// Authorisation of a sharing-link visitor's session, which also sweeps expired lines out of the
// session file; and the CGI record's lookup of the "id" cookie.
#include <errno.h>
#include <limits.h>
#include <stdarg.h>
#include <stdio.h>
#include <stdlib.h>
#include <string.h>
#include <sys/uio.h>
#include <unistd.h>

#include <algorithm>
#include <memory>
#include <string_view>
#include <vector>

#include "common/log.h"
#include "common/owners.h"
#include "norvo/norvologin.h"
#include "norvologin/session_file.h"
#include "quib_autoblock.h"
#include "quib_paths.h"
#include "quib_user.h"
#include "vlibc_err.h"
#include "vlibc_file.h"
#include "vlibc_line_file.h"

namespace norvo::login {
namespace {

struct FdClose {
    void operator()(const int *fd) const { close(*fd); }
};
struct SectionEnd {
    void operator()(const int *handle) const { QuibCgiEndCriticalSection(*handle); }
};
// Owning handles of a descriptor and a critical section (the pointer is to the caller's int).
using Fd = std::unique_ptr<const int, FdClose>;
using Section = std::unique_ptr<const int, SectionEnd>;

const char *AppIdOf(_tag_cgi_position position) {
    switch (position) {
        case CGI_POSITION_FILE_BROWSER:
            return "QUIB.TVQ.App.Tovana3.Instance";
        case CGI_POSITION_AURELO:
            return "QUIB.TVQ.Aurelo.Application";
        case CGI_POSITION_SILVORY:
            return "QUIB.TVQ.Silvory";
        case CGI_POSITION_DUNETRA:
            return "QUIB.TVQ.Dunetra.Application";
        default:
            return nullptr;
    }
}

bool SkipSourceCheck() {
    char value[16] = "";
    return VLIBCFileGetKeyValue(QUIB_INFO_CONF, "skip_checksrcip", value, sizeof value, 0) > 0 &&
           strcmp(value, "yes") == 0;
}

// The rewritten file: runs of the text read, carried over as they are, and formatted lines.
class Output {
public:
    explicit Output(const char *text) : text_(text) {}
    void Keep(size_t offset, size_t length) {
        if (!pieces_.empty() && !pieces_.back().formatted &&
            pieces_.back().offset + pieces_.back().length == offset) {
            pieces_.back().length += length;
        } else {
            pieces_.push_back({false, offset, length});
        }
    }
    void Add(const char *format, ...) __attribute__((format(printf, 2, 3)));
    // Writes it all to fd; false when any of it could not be written.
    bool WriteTo(int fd) const;

private:
    struct Piece {
        bool formatted;  // in lines_, else in the text read
        size_t offset, length;
    };
    const char *text_;
    std::string lines_;
    std::vector<Piece> pieces_;
};

void Output::Add(const char *format, ...) {
    char line[kLineBuffer * 2];
    va_list args;
    va_start(args, format);
    const int n = vsnprintf(line, sizeof line, format, args);
    va_end(args);
    if (n > 0) {
        const size_t length = std::min(static_cast<size_t>(n), sizeof line - 1);
        pieces_.push_back({true, lines_.size(), length});
        lines_.append(line, length);
    }
}

bool Output::WriteTo(int fd) const {
    std::vector<struct iovec> iov;
    for (const Piece &piece : pieces_) {
        const char *base = piece.formatted ? lines_.data() : text_;
        iov.push_back({const_cast<char *>(base + piece.offset), piece.length});
    }
    for (size_t first = 0; first < iov.size();) {
        const int count = static_cast<int>(std::min<size_t>(iov.size() - first, IOV_MAX));
        ssize_t put = writev(fd, &iov[first], count);
        if (put < 0 && errno == EINTR) {
            continue;
        }
        if (put <= 0) {
            return false;
        }
        // A short write: skip what went out and go on with the rest.
        while (first < iov.size() && static_cast<size_t>(put) >= iov[first].iov_len) {
            put -= static_cast<ssize_t>(iov[first].iov_len);
            ++first;
        }
        if (first < iov.size()) {
            iov[first].iov_base = static_cast<char *>(iov[first].iov_base) + put;
            iov[first].iov_len -= static_cast<size_t>(put);
        }
    }
    return true;
}

// Equality of a line's field and a given text; most fields differ in their first byte.
inline bool Same(std::string_view field, std::string_view text) {
    return field.size() == text.size() && (text.empty() || field[0] == text[0]) && field == text;
}
// Whether a number field reads 0, as the persistent flag mostly does.
inline bool IsZero(std::string_view field) {
    return field == "0" || static_cast<int>(NumberOf(field)) == 0;
}

// The decision for the session's own line; false when the line is to be dropped.
struct Verdict {
    int result;
    bool keep;
    bool asRead = false;  // kept as it was read, not refreshed
};
Verdict Judge(const SessionLine &line, const char *user, const CONFIRM_POLICY &policy,
              _tag_cgi_position position, bool expired) {
    PQUIBUSER record = nullptr;
    if (QUIBUserGet(user, &record) != 0) {
        // Only an account that is gone ends the session; a lookup that failed refuses this once.
        const bool gone = VLIBCErrGet() == QUIB_ERR_NO_SUCH_USER;
        return {-2, !gone, !gone};
    }
    UserRecord owned(record);
    // An expired account is refused: the application check alone would let it through.
    const int accountExpired = QUIBUserIsExpired(user);
    const char *appId = AppIdOf(position);
    if (accountExpired == 1 || (appId != nullptr && VLIBUserPrivilegeHas(user, appId) != 1)) {
        return {-2, false};
    }
    int admin = QUIBGroupIsAdminGroupMem(user);
    if (admin < 0) {
        if (VLIBCErrGet() != QUIB_ERR_NO_SUCH_USER) {
            NVO_LOG(kModule, "%s:%d QUIBGroupIsAdminGroupMem(%s) failed. [0x%04X %s:%d]", user, VLIBCErrGet(),
                    VLIBCErrorGetFile(), VLIBCErrorGetLine());
        }
        admin = 0;
    }
    const int result = (policy.acceptMask & 1) && admin == 1 ? 2 : (policy.acceptMask & 2) ? 1 : -2;
    if (!line.Persistent() && expired) {
        return {-1, policy.noRefresh != 0, policy.noRefresh != 0};
    }
    return {result, true};
}

}  // namespace
}  // namespace norvo::login

using namespace norvo::login;

int NorvoLogin::IsAuthorizedByPath(QUIB::WebCGI *cgi, const char *sessionId, char *userOut, int userOutLen,
                                   _tag_confirm_policy *policy, _tag_cgi_position position,
                                   const char *cookieName) try {
    char address[64];
    if (cgi == nullptr || userOut == nullptr || userOutLen <= 0 || policy == nullptr ||
        sessionId == nullptr || !ClientAddress(address)) {
        return -4;
    }
    if (cookieName == nullptr) {
        cookieName = "";
    }
    // Ids have 12 secret bits (the salt); an address that keeps guessing is blocked.
    if (QuibCgiIsDeniedIP(address) == 1) {
        return -2;
    }
    // The compared copy is 46 bytes, enough for any IP literal.
    char compared[46] = "";
    memcpy(compared, address, std::min(strlen(address), sizeof compared - 1));
    int result = -2;
    bool known = false;  // a line holds this session (from a usable address)
    [&] {
        const int lock = QuibCgiBeginCriticalSection(SessionLock().c_str(), kLockTimeoutMs);
        if (lock < 0) {
            NVO_LOG(kModule, "%s (%d) QuibCgiBeginCriticalSection Failed.");
            known = true;  // not the cookie's fault
            return;
        }
        const Section section(&lock);
        // Read under the lock: a line written meanwhile would otherwise lie ahead of it.
        const Clock clock = ReadClock();
        off_t size = 0;
        const int in = OpenOwnFile(SessionFile().c_str(), false, &size);
        if (in < 0) {
            NVO_SET_QUIB_ERR(kModule, QUIB_ERR_OPEN_FAILED);
            return;  // no sessions: the cookie names none
        }
        const Fd inOwned(&in);
        const int out = OpenOwnFile(SessionScratch().c_str(), true);
        if (out < 0) {
            NVO_SET_QUIB_ERR(kModule, QUIB_ERR_OPEN_FAILED);
            NVO_LOG(kModule, "%s(%d): file open error, reason=%m");
            result = -4, known = true;
            return;
        }
        Fd outOwned(&out);
        FileText text;
        if (!ReadPadded(in, static_cast<size_t>(size), &text)) {
            result = -4, known = true;
            return;
        }
        Output kept(text.data.get());
        int skip = -1;  // read when first needed
        std::vector<char> copy(kLineBuffer);
        const auto judge = [&](char *buf) {
            SessionLine line;
            if (!ParseLine(buf, &line)) {
                return;
            }
            const bool expired = !line.Persistent() && Expired(clock, line.LastAccess());
            if (strcmp(line.field[2], sessionId) == 0 && strcmp(line.field[7], cookieName) == 0 &&
                (strcmp(line.field[0], compared) == 0 ||
                 (skip < 0 ? (skip = SkipSourceCheck()) : skip) == 1)) {
                known = true;
                const char *user = line.field[1];
                setenv("USERNAME", user, 1);
                snprintf(userOut, static_cast<size_t>(userOutLen), "%s", user);
                const Verdict verdict = Judge(line, user, *policy, position, expired);
                result = verdict.result;
                if (verdict.keep && !verdict.asRead) {
                    kept.Add("%s,%s,%s,%s,%ld,%d,%s,%s\n", line.field[0], line.field[1], line.field[2],
                             line.field[3], policy->noRefresh != 0 ? line.LastAccess() : clock.now,
                             static_cast<int>(position), line.field[6], line.field[7]);
                }
                if (!verdict.asRead) {
                    return;
                }
            } else if (expired) {
                return;
            }
            kept.Add("%s,%s,%s,%s,%s,%s,%s,%s\n", line.field[0], line.field[1], line.field[2], line.field[3],
                     line.field[4], line.field[5], line.field[6], line.field[7]);
        };
        const std::string_view id(sessionId), cookie(cookieName);
        for (size_t pos = 0; pos < text.size;) {
            const char *piece = text.data.get() + pos;
            PlainLine plain;
            bool isPlain = false;
            const size_t length = ScanLine(piece, text.size - pos, &plain, &isPlain);
            if (isPlain && (!Same(plain.field[2], id) || plain.field[7] != cookie)) {
                if (!IsZero(plain.field[6]) || !Expired(clock, NumberOf(plain.field[4]))) {
                    kept.Keep(pos, length);
                }
            } else {
                memcpy(copy.data(), piece, length);
                copy[length] = '\0';
                judge(copy.data());
            }
            pos += length;
        }
        // A short or failed write keeps the old file: the scratch file goes, never over it.
        const bool written = kept.WriteTo(out);
        outOwned.release();
        const bool closed = close(out) == 0;
        if (!written || !closed || VLIBCSysRename(SessionScratch().c_str(), SessionFile().c_str()) != 0) {
            unlink(SessionScratch().c_str());
            result = -4, known = true;
        }
    }();
    if (!known) {
        AutoBlockFailLoginSet(address, "FOLDER_SHARING");
    }
    return result;
} catch (...) {
    return -4;
}

int QuibCgiHasRecord(QuibCgi *cgi, char *userOut, int userOutLen, const char *cookieName) try {
    char id[128];
    if (cgi == nullptr || userOut == nullptr || userOutLen <= 0 ||
        QuibCgiGetInCookies(cgi, "id", id, sizeof id) != 0) {
        return 0;
    }
    if (cookieName == nullptr) {
        cookieName = "";
    }
    const int lock = QuibCgiBeginCriticalSection(cgi->szLockName, kLockTimeoutMs);
    if (lock < 0) {
        NVO_LOG(kModule, "%s (%d) QuibCgiBeginCriticalSection Failed.");
        return 0;
    }
    const Section section(&lock);
    const int in = OpenOwnFile(cgi->szRecordFile, false);
    if (in < 0) {
        return 0;
    }
    const Fd inOwned(&in);
    std::string text;
    if (!ReadAll(in, &text)) {
        return 0;
    }
    int found = 0;
    char buf[1024];
    ForEachPiece(text, sizeof buf, [&](std::string_view piece) {
        memcpy(buf, piece.data(), piece.size());
        buf[piece.size()] = '\0';
        SessionLine line;
        if (found == 0 && ParseLine(buf, &line) && strcmp(line.field[2], id) == 0 &&
            strcmp(line.field[7], cookieName) == 0) {
            snprintf(userOut, static_cast<size_t>(userOutLen), "%s", line.field[1]);
            found = 1;
        }
    });
    return found;
} catch (...) {
    return 0;
}
