// norvo.cgi: the reference CGI program behind the web server. A small JSON API in the style of
// the file manager's requests; for now the visitor of a public sharing link:
//
//   ?api=login&FOLDER_SHARING=LINK   logs the link's user in (cookie LINK=<session id>)
//   ?api=list&FOLDER_SHARING=LINK    the shared folder's entries, for an authorised visitor
//                                    (sort, offset, limit as the listing takes them)
//   POST ?api=upload&FOLDER_SHARING=LINK   multipart/form-data, one part with a filename: the
//                                    file lands in the link's folder, the link user's own
//   ?api=download&FOLDER_SHARING=LINK&file=NAME   the bytes of NAME below the link's folder
//   ?api=page&FOLDER_SHARING=LINK    the link's landing page (HTML; "tunnel", "noCache", "md5")
//
// Answers {"success":true,"data":{...}} or {"success":false,"error":{"code":N,"key":"..."}}.
// A link is a row of the link database: its folder (a user path) while the link is within its
// dates, and its owner's uid, whose account the visitor acts as.
#include <errno.h>
#include <fcntl.h>
#include <grp.h>
#include <linux/openat2.h>
#include <stdio.h>
#include <stdlib.h>
#include <string.h>
#include <sys/stat.h>
#include <sys/syscall.h>
#include <unistd.h>

#include <algorithm>
#include <iostream>
#include <list>
#include <memory>
#include <string>
#include <vector>

#include <json/json.h>
#include <sqlite3.h>

#include "identity.h"
#include "multipart.h"
#include "norvo/norvo.h"
#include "quib_cgi.h"
#include "quib_db.h"
#include "quib_user.h"

namespace {

constexpr char kLinkDatabase[] = "/usr/quib/etc/filebrowser/fbsharing.db";
constexpr int kInfo = NVO_INFO_SIZE | NVO_INFO_OWNER | NVO_INFO_TIME | NVO_INFO_PERM | NVO_INFO_TYPE;

struct Link {
    std::string user, path;
};

// A link id is a cookie name too: letters, digits, "_" and "-", at most 64.
bool GoodLinkId(const char *id) {
    const size_t n = id == nullptr ? 0 : strlen(id);
    return n >= 1 && n <= 64 &&
           strspn(id, "ABCDEFGHIJKLMNOPQRSTUVWXYZabcdefghijklmnopqrstuvwxyz0123456789_-") == n;
}

// The account of the link's owner (its "uid"), "" when there is none.
std::string LinkOwner(const char *id) {
    std::unique_ptr<char, void (*)(void *)> sql(
        sqlite3_mprintf("SELECT uid FROM sharingLinks WHERE linkID = %Q LIMIT 1;", id), sqlite3_free);
    std::unique_ptr<QUIBDB, void (*)(PQUIBDB)> db(QUIBDBConnect(nullptr, nullptr, nullptr, kLinkDatabase),
                                                  QUIBDBClose);
    PQUIBDB_RESULT raw = nullptr;
    if (!sql || !db || QUIBDBExecute(db.get(), sql.get(), &raw) != 0) {
        return "";
    }
    std::unique_ptr<QUIBDB_RESULT, void (*)(PQUIBDB_RESULT)> result(raw, QUIBDBFreeResult);
    QUIBDB_ROW row = 0;
    const char *uid =
        QUIBDBFetchRow(result.get(), &row) == 0 ? QUIBDBFetchField(result.get(), row, "uid") : nullptr;
    if (uid == nullptr || uid[0] == '\0' || strspn(uid, "0123456789") != strlen(uid) || strlen(uid) > 9) {
        return "";
    }
    PQUIBUSER user = nullptr;
    if (QUIBUserGetByUID(static_cast<uid_t>(strtoul(uid, nullptr, 10)), &user, 0) != 0) {
        return "";
    }
    std::string name = user->szName;
    QUIBUserFree(user);
    return name;
}

// The link's folder (within its dates) and owner; false when either is missing.
bool FindLink(QUIB::WebCGI &cgi, const NorvoLogin::FolderSharingLoginManager &manager, const char *id,
              Link *link) {
    link->path = manager.GetSharingFolderPath(cgi);
    link->user = LinkOwner(id);
    return link->path.size() > 1 && link->path[0] == '/' && !link->user.empty();
}

int Answer(QUIB::WebCGI &cgi, const Json::Value &answer) {
    cgi.WriteHeader();
    Json::StreamWriterBuilder writer;
    writer["indentation"] = "";
    std::cout << Json::writeString(writer, answer) << '\n';
    return 0;
}

int Fail(QUIB::WebCGI &cgi, int code) {
    Json::Value answer;
    answer["success"] = false;
    answer["error"]["code"] = code;
    answer["error"]["key"] = NvoParseErrorToOBXString(code, "error:error_system");
    return Answer(cgi, answer);
}

unsigned long Number(const QUIB::WebCGI &cgi, const char *name) {
    const char *text = cgi.In(name);
    return text != nullptr && strspn(text, "0123456789") == strlen(text) && strlen(text) < 10
               ? strtoul(text, nullptr, 10)
               : 0;
}

// The link's folder as its user sees it: resolved, checked, and read under the user's identity.
int List(QUIB::WebCGI &cgi, const Link &link) {
    std::string real, share, volume, sharePath;
    NvoLibSetErr(NVO_ERR_NONE);
    if (!NvoFullPathGet(link.path.c_str(), real, share, volume, sharePath, link.user)) {
        return Fail(cgi, NvoLibGetErr());
    }
    NvoLibSetErr(NVO_ERR_NONE);
    if (CheckShareListPrivilege(link.user.c_str(), nullptr, link.path.c_str()) != 1) {
        return Fail(cgi, NvoLibGetErr() != NVO_ERR_NONE ? NvoLibGetErr() : NVO_ERR_PRIVILEGE);
    }
    PQUIBUSER record = nullptr;
    if (QUIBUserGet(link.user.c_str(), &record) != 0) {
        return Fail(cgi, NVO_ERR_NO_USER);
    }
    const std::unique_ptr<QUIBUSER, void (*)(PQUIBUSER)> user(record, QUIBUserFree);
    std::string error;
    std::unique_ptr<norvo::cli::UserIdentity> identity = norvo::cli::UserIdentity::Assume(*user, &error);
    if (!identity) {
        return Fail(cgi, NVO_ERR_SYSTEM);
    }
    NvoEnum lister;
    std::list<DIRENTRY_INFO> files;
    unsigned long total = 0;
    const unsigned long offset = Number(cgi, "offset");
    const char *sort = cgi.In("sort");
    NvoLibSetErr(NVO_ERR_NONE);
    const int listed = lister.NvoLibDirEntryListEnum(
        link.path.c_str(), real.c_str(), sort != nullptr ? sort : "name", kInfo, offset, Number(cgi, "limit"),
        true, DIR_ENTRY_TYPE_ALL, {}, files, &total);
    identity.reset();
    if (listed != 1) {
        return Fail(cgi, NvoLibGetErr() != NVO_ERR_NONE ? NvoLibGetErr() : NVO_ERR_SYSTEM);
    }
    Json::Value answer;
    answer["success"] = true;
    answer["data"]["total"] = static_cast<Json::UInt64>(total);
    answer["data"]["offset"] = static_cast<Json::UInt64>(offset);
    answer["data"]["files"] = Json::Value(Json::arrayValue);
    for (const DIRENTRY_INFO &entry : files) {
        Json::Value item(Json::objectValue);
        DumpFileInfo(kInfo, entry, item);
        answer["data"]["files"].append(item);
    }
    return Answer(cgi, answer);
}

bool WriteAll(int fd, const char *data, size_t size) {
    while (size > 0) {
        const ssize_t put = write(fd, data, size);
        if (put < 0 && errno == EINTR) {
            continue;
        }
        if (put <= 0) {
            return false;
        }
        data += put, size -= static_cast<size_t>(put);
    }
    return true;
}

// The uploaded file's one part, checked as the link's user before its first byte arrives (the
// check leaves the process as that user), then written by the user into a folder of their own
// on the target's volume, so the move into place is a rename and the user's quota counts.
class UploadSink : public norvo::cgi::MultipartReader::Sink {
public:
    UploadSink(const Link &link, std::string scratch) : link_(link), scratch_(std::move(scratch)) {}
    ~UploadSink() override {
        if (fd_ >= 0) {
            close(fd_);
        }
        if (!path_.empty()) {
            unlink(path_.c_str());
        }
        if (!dir_.empty()) {
            rmdir(dir_.c_str());
        }
    }
    UploadSink(const UploadSink &) = delete;
    UploadSink &operator=(const UploadSink &) = delete;

    bool Begin(const norvo::cgi::Part &part) override {
        if (!part.file) {
            return true;  // other fields are skipped
        }
        if (!visible_.empty() || part.filename.empty()) {
            return Refuse(NVO_UPLOAD_ERR_BAD_REQUEST);
        }
        visible_ = link_.path + "/" + part.filename;
        std::string share, volume, sharePath;
        NvoLibSetErr(NVO_ERR_NONE);
        if (!NvoFullPathGet(visible_.c_str(), real_, share, volume, sharePath, link_.user)) {
            code_ = NvoLibGetErr() != NVO_ERR_NONE ? NvoLibGetErr() : NVO_ERR_NO_PATH;
            return false;
        }
        int type = 1;  // an existing file is replaced
        if (const int code = CheckFile(visible_, link_.user.c_str(), nullptr, &type)) {
            code_ = code;
            return false;
        }
        std::string dir = scratch_ + "/upload.XXXXXX";
        if (mkdtemp(dir.data()) == nullptr) {
            return Refuse(errno == ENOSPC ? NVO_UPLOAD_ERR_NO_SPACE : NVO_UPLOAD_ERR_TEMP_FILE);
        }
        dir_ = dir;
        path_ = dir_ + "/file";
        fd_ = open(path_.c_str(), O_WRONLY | O_CREAT | O_EXCL | O_NOFOLLOW | O_CLOEXEC, 0600);
        if (fd_ < 0) {
            path_.clear();
            return Refuse(NVO_UPLOAD_ERR_TEMP_FILE);
        }
        return true;
    }
    bool Data(const char *data, size_t size) override {
        if (fd_ < 0) {
            return true;
        }
        if (!WriteAll(fd_, data, size)) {
            return Refuse(errno == ENOSPC   ? NVO_UPLOAD_ERR_NO_SPACE
                          : errno == EDQUOT ? NVO_UPLOAD_ERR_QUOTA
                          : errno == EFBIG  ? NVO_UPLOAD_ERR_TOO_LARGE
                                            : NVO_UPLOAD_ERR_SYSTEM);
        }
        size_ += static_cast<long long>(size);
        return true;
    }
    bool End() override {
        if (fd_ < 0) {
            return true;
        }
        const int fd = fd_;
        fd_ = -1;
        return close(fd) == 0 || Refuse(errno == ENOSPC ? NVO_UPLOAD_ERR_NO_SPACE : NVO_UPLOAD_ERR_SYSTEM);
    }

    // Moves the arrived file into place; 0 or the library code.
    int Move() {
        NvoLibSetErr(NVO_ERR_NONE);
        if (MoveFile(link_.user.c_str(), path_.c_str(), real_.c_str(), nullptr) != 1) {
            return NvoLibGetErr() != NVO_ERR_NONE ? NvoLibGetErr() : NVO_ERR_SYSTEM;
        }
        path_.clear();
        return 0;
    }

    int code() const { return code_; }
    bool arrived() const { return !path_.empty() && fd_ < 0; }
    const std::string &visible() const { return visible_; }
    long long size() const { return size_; }

private:
    bool Refuse(int uploadError) {
        code_ = ConvUploadErrnoToAPIErr(uploadError);
        return false;
    }

    const Link &link_;
    const std::string scratch_;
    std::string visible_, real_, dir_, path_;
    int fd_ = -1;
    long long size_ = 0;
    int code_ = 0;
};

// Reads the body from stdin through the multipart reader into the sink; 0 or the library code.
// A refused body is still read to its end, so the client gets the answer rather than a reset.
int ReadUpload(const std::string &boundary, UploadSink &sink) {
    const char *lengthText = getenv("CONTENT_LENGTH");
    if (lengthText == nullptr || *lengthText == '\0' ||
        strspn(lengthText, "0123456789") != strlen(lengthText) || strlen(lengthText) > 15) {
        return ConvUploadErrnoToAPIErr(NVO_UPLOAD_ERR_BAD_REQUEST);
    }
    unsigned long long left = strtoull(lengthText, nullptr, 10);
    norvo::cgi::MultipartReader reader(boundary, &sink);
    norvo::cgi::MultipartReader::Result result = norvo::cgi::MultipartReader::kMore;
    static char buf[65536];
    while (left > 0) {
        const ssize_t got = read(STDIN_FILENO, buf, left < sizeof buf ? left : sizeof buf);
        if (got < 0 && errno == EINTR) {
            continue;
        }
        if (got <= 0) {
            break;
        }
        left -= static_cast<unsigned long long>(got);
        if (result != norvo::cgi::MultipartReader::kBad) {
            result = reader.Feed(buf, static_cast<size_t>(got));
        }
    }
    if (sink.code() != 0) {
        return sink.code();
    }
    if (result == norvo::cgi::MultipartReader::kBad) {
        return ConvUploadErrnoToAPIErr(NVO_UPLOAD_ERR_BAD_REQUEST);
    }
    if (left > 0 || reader.Finish() != norvo::cgi::MultipartReader::kDone) {
        return ConvUploadErrnoToAPIErr(reader.InPart() || left > 0 ? NVO_UPLOAD_ERR_INCOMPLETE
                                                                   : NVO_UPLOAD_ERR_BAD_REQUEST);
    }
    return sink.arrived() ? 0 : ConvUploadErrnoToAPIErr(NVO_UPLOAD_ERR_NO_FILE);
}

int Upload(QUIB::WebCGI &cgi, const Link &link) {
    const char *method = getenv("REQUEST_METHOD");
    const std::string boundary = norvo::cgi::MultipartBoundary(getenv("CONTENT_TYPE"));
    if (method == nullptr || strcmp(method, "POST") != 0 || boundary.empty()) {
        return Fail(cgi, ConvUploadErrnoToAPIErr(NVO_UPLOAD_ERR_BAD_REQUEST));
    }
    std::string real, share, volume, sharePath;
    NvoLibSetErr(NVO_ERR_NONE);
    if (!NvoFullPathGet(link.path.c_str(), real, share, volume, sharePath, link.user)) {
        return Fail(cgi, NvoLibGetErr());
    }
    if (NvoCreateTmpDir(volume.c_str()) != 0) {
        return Fail(cgi, NVO_ERR_SYSTEM);
    }
    // CheckFile leaves the process as the user for the rest of the upload; root comes back
    // only when the request is done (the leak check at exit needs a process it may trace).
    const norvo::cli::SavedIdentity saved;
    UploadSink sink(link, volume + "/@tmp/norvo");
    int code = ReadUpload(boundary, sink);
    if (code == 0) {
        code = sink.Move();
    }
    if (code != 0) {
        return Fail(cgi, code);
    }
    NvoLibDoLog(link.user, sink.visible(), sink.size(), NORVO_ACTION_UPLOAD, false);
    Json::Value answer;
    answer["success"] = true;
    answer["data"]["path"] = sink.visible();
    answer["data"]["size"] = static_cast<Json::Int64>(sink.size());
    return Answer(cgi, answer);
}

// A path below the link's folder: names joined by "/", none empty, "." or "..", no control byte.
bool SafeRelative(const char *path) {
    if (path == nullptr || *path == '\0' || strlen(path) > 4095) {
        return false;
    }
    const std::string text = path;
    for (size_t at = 0; at <= text.size();) {
        size_t end = text.find('/', at);
        end = end == std::string::npos ? text.size() : end;
        if (!norvo::cgi::SafeFileName(text.substr(at, end - at))) {
            return false;
        }
        at = end + 1;
    }
    return true;
}

// Content-Disposition for name: a plain ASCII fallback and the exact name as UTF-8
// percent-encoded (RFC 6266, RFC 8187), so no byte of the name reaches the header raw.
std::string Disposition(const std::string &name) {
    std::string plain, exact;
    static const char kHex[] = "0123456789ABCDEF";
    for (const char c : name) {
        const unsigned char u = static_cast<unsigned char>(c);
        plain += u >= 0x20 && u < 0x7F && c != '"' && c != '\\' && c != '%' ? c : '_';
        if (isalnum(u) || strchr("!#$&+-.^_`|~", c) != nullptr) {
            exact += c;
        } else {
            exact += '%', exact += kHex[u >> 4], exact += kHex[u & 15];
        }
    }
    return "attachment; filename=\"" + plain + "\"; filename*=UTF-8''" + exact;
}

// The file, read as the link's user without following a link or leaving the link's folder.
int Download(QUIB::WebCGI &cgi, const Link &link) {
    const char *file = cgi.In("file");
    if (!SafeRelative(file)) {
        return Fail(cgi, NVO_ERR_GENERAL);
    }
    const std::string visible = link.path + "/" + file;
    std::string real, share, volume, sharePath;
    NvoLibSetErr(NVO_ERR_NONE);
    if (!NvoFullPathGet(link.path.c_str(), real, share, volume, sharePath, link.user)) {
        return Fail(cgi, NvoLibGetErr());
    }
    if (CheckShareDownloadPrivilege(link.user.c_str(), nullptr, visible.c_str()) != 1) {
        return Fail(cgi, NVO_ERR_PRIVILEGE);
    }
    PQUIBUSER record = nullptr;
    if (QUIBUserGet(link.user.c_str(), &record) != 0) {
        return Fail(cgi, NVO_ERR_NO_USER);
    }
    const std::unique_ptr<QUIBUSER, void (*)(PQUIBUSER)> user(record, QUIBUserFree);
    std::string error;
    const std::unique_ptr<norvo::cli::UserIdentity> identity =
        norvo::cli::UserIdentity::Assume(*user, &error);
    if (!identity) {
        return Fail(cgi, NVO_ERR_SYSTEM);
    }
    const int dir = open(real.c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC);
    open_how how{};
    how.flags = O_RDONLY | O_CLOEXEC | O_NOFOLLOW;
    how.resolve = RESOLVE_BENEATH | RESOLVE_NO_SYMLINKS | RESOLVE_NO_MAGICLINKS;
    const int fd = dir < 0 ? -1 : static_cast<int>(syscall(SYS_openat2, dir, file, &how, sizeof how));
    const int openError = errno;
    if (dir >= 0) {
        close(dir);
    }
    struct stat st;
    if (fd < 0 || fstat(fd, &st) != 0 || !S_ISREG(st.st_mode)) {
        if (fd >= 0) {
            close(fd);
        }
        return Fail(cgi, fd < 0 && openError == EACCES ? NVO_ERR_PRIVILEGE : NVO_ERR_NO_PATH);
    }
    const std::string name = strrchr(visible.c_str(), '/') + 1;
    const std::string head = "Content-Length: " + std::to_string(st.st_size) +
                             "\r\nContent-Disposition: " + Disposition(name) + "\r\n";
    bool sent =
        WriteAll(STDOUT_FILENO, head.data(), head.size()) && cgi.WriteHeader("application/octet-stream") == 0;
    // Recorded before the last byte goes: the server may end the program once it has them all.
    if (sent) {
        NvoLibDoLog(link.user, visible, st.st_size, NORVO_ACTION_DOWNLOAD, false);
    }
    long long left = st.st_size;
    static char buf[65536];
    while (sent && left > 0) {
        const ssize_t got = read(fd, buf, sizeof buf);
        sent = got > 0 && WriteAll(STDOUT_FILENO, buf, static_cast<size_t>(got));
        left -= got;
    }
    close(fd);
    return 0;
}

}  // namespace

int main() {
    QUIB::WebCGI cgi;
    if (cgi.Init() != 0) {
        return Fail(cgi, NVO_ERR_GENERAL);
    }
    const char *api = cgi.In("api");
    const char *id = cgi.In("FOLDER_SHARING");
    if (api == nullptr || !GoodLinkId(id)) {
        return Fail(cgi, NVO_ERR_GENERAL);
    }
    NorvoLogin::FolderSharingLoginManager manager;
    Link link;
    // The parameter names the link, never the server's header.
    unsetenv("HTTP_FOLDER_SHARING");
    if (!FindLink(cgi, manager, id, &link)) {
        manager.folderSharingFailLoginSet();  // guessing link ids counts as failing to log in
        return Fail(cgi, NVO_ERR_NO_PATH);
    }
    if (strcmp(api, "login") == 0) {
        if (!manager.folderSharingLogin(cgi, id, link.user)) {
            return Fail(cgi, NVO_ERR_PRIVILEGE);
        }
        Json::Value answer;
        answer["success"] = true;
        answer["data"]["user"] = manager.GetLoginUserName();
        return Answer(cgi, answer);
    }
    if (strcmp(api, "page") == 0) {
        manager.WriteWebPage(cgi, cgi.In("md5", ""), link.path);
        return 0;
    }
    if (strcmp(api, "list") == 0) {
        // The session must be this link's and its user's: another link's cookie is no key here.
        if (!manager.isAuthorized(cgi, id) || manager.GetLoginUserName() != link.user) {
            return Fail(cgi, NVO_ERR_PRIVILEGE);
        }
        return List(cgi, link);
    }
    if (strcmp(api, "upload") == 0 || strcmp(api, "download") == 0) {
        if (!manager.isAuthorized(cgi, id) || manager.GetLoginUserName() != link.user) {
            return Fail(cgi, NVO_ERR_PRIVILEGE);
        }
        return api[0] == 'u' ? Upload(cgi, link) : Download(cgi, link);
    }
    return Fail(cgi, NVO_ERR_GENERAL);
}
