// norvo.cgi: the reference CGI program behind the web server. A small JSON API in the style of
// the file manager's requests; for now the visitor of a public sharing link:
//
//   ?api=login&FOLDER_SHARING=LINK   logs the link's user in (cookie LINK=<session id>)
//   ?api=list&FOLDER_SHARING=LINK    the shared folder's entries, for an authorised visitor
//                                    (sort, offset, limit as the listing takes them)
//
// Answers {"success":true,"data":{...}} or {"success":false,"error":{"code":N,"key":"..."}}.
// Links come from /usr/quib/etc/norvo_cgi_links.conf, LINK="USER:/user/path", until the link
// database serves them.
#include <stdio.h>
#include <stdlib.h>
#include <string.h>

#include <iostream>
#include <list>
#include <memory>
#include <string>
#include <vector>

#include <json/json.h>

#include "identity.h"
#include "norvo/norvo.h"
#include "quib_cgi.h"
#include "quib_user.h"
#include "vlibc_file.h"

namespace {

constexpr char kLinks[] = "/usr/quib/etc/norvo_cgi_links.conf";
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

bool FindLink(const char *id, Link *link) {
    char value[4200];
    if (VLIBCFileGetKeyValue(kLinks, id, value, sizeof value, 0) <= 0) {
        return false;
    }
    const char *colon = strchr(value, ':');
    if (colon == nullptr || colon[1] != '/') {
        return false;
    }
    link->user.assign(value, static_cast<size_t>(colon - value));
    link->path = colon + 1;
    return true;
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
    if (!FindLink(id, &link)) {
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
    if (strcmp(api, "list") == 0) {
        // The session must be this link's and its user's: another link's cookie is no key here.
        if (!manager.isAuthorized(cgi, id) || manager.GetLoginUserName() != link.user) {
            return Fail(cgi, NVO_ERR_PRIVILEGE);
        }
        return List(cgi, link);
    }
    return Fail(cgi, NVO_ERR_GENERAL);
}
