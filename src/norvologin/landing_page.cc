// The landing page of a sharing link: the web interface's scripts and styles, and the link's
// values handed to them as script variables. What comes from a request or the link database is
// escaped for where it lands, or left out: the page must never run or load a stranger's code.
#include <stdio.h>
#include <stdlib.h>
#include <string.h>
#include <time.h>

#include <string>

#include "norvo/norvologin.h"
#include "quib_cgi.h"
#include "quib_strings.h"
#include "quib_webutils.h"

namespace norvo::login {
namespace {

constexpr char kWebInterface[] = "/usr/quib/quibman/webman/";

// Text inside an element or a quoted attribute.
std::string HtmlEscaped(const char *text) {
    std::string out;
    for (const char *p = text; *p != '\0'; ++p) {
        switch (*p) {
            case '&':
                out += "&amp;";
                break;
            case '<':
                out += "&lt;";
                break;
            case '>':
                out += "&gt;";
                break;
            case '"':
                out += "&quot;";
                break;
            case '\'':
                out += "&#39;";
                break;
            default:
                out += *p;
        }
    }
    return out;
}

// The inside of a '...' string in a script element. Quote, backslash and double quote as the
// page's scripts expect them; "<" so that no value can close the element; line terminators
// so that none can end the string.
std::string ScriptEscaped(const std::string &text) {
    std::string out;
    out.reserve(text.size());
    for (size_t i = 0; i < text.size(); ++i) {
        const char c = text[i];
        if (c == '\'' || c == '\\' || c == '"') {
            out += '\\';
            out += c;
        } else if (c == '<') {
            out += "\\x3C";
        } else if (c == '\n') {
            out += "\\n";
        } else if (c == '\r') {
            out += "\\r";
        } else if (c == '\xE2' && i + 2 < text.size() && text[i + 1] == '\x80' &&
                   (text[i + 2] == '\xA8' || text[i + 2] == '\xA9')) {
            out += text[i + 2] == '\xA8' ? "\\u2028" : "\\u2029";  // line terminators to JavaScript
            i += 2;
        } else {
            out += c;
        }
    }
    return out;
}

bool IsHex(const std::string &text) {
    return text.find_first_not_of("0123456789abcdefABCDEF") == std::string::npos;
}

// A path of this site: one leading "/", never "//" (another host), only characters that need
// no quoting in a URL or an attribute. Anything else becomes "" (site-relative URLs).
std::string SameSitePath(const char *tunnel) {
    const std::string t = tunnel;
    const bool ok = t.empty() || (t[0] == '/' && t.find("//") == std::string::npos &&
                                  t.find_first_not_of("ABCDEFGHIJKLMNOPQRSTUVWXYZabcdefghijklmnopqrstuvwxyz"
                                                      "0123456789/_.~-") == std::string::npos);
    return ok ? t : "";
}

std::string TitleOf(const std::string &folderPath) {
    const size_t slash = folderPath.rfind('/');
    const std::string &shown = slash != std::string::npos && slash + 1 < folderPath.size()
                                   ? folderPath.substr(slash + 1)
                                   : folderPath;
    char title[255];
    snprintf(title, sizeof title, "%s", shown.c_str());
    return HtmlEscaped(title);
}

}  // namespace
}  // namespace norvo::login

namespace NorvoLogin {

void FolderSharingLoginManager::WriteWebPage(QUIB::WebCGI &cgi, const std::string &md5,
                                             const std::string &folderPath) try {
    using namespace norvo::login;
    const std::string tunnel = SameSitePath(cgi.In("tunnel", ""));
    const char *T = tunnel.c_str();
    const bool noCache = cgi.In("noCache", "")[0] != '\0';
    // Opened for the page's life; its strings are the front end's to show.
    StringBundle strings(QUIB_STRINGS_FILE_MANAGER, "filetable", nullptr, nullptr, nullptr, nullptr, nullptr);
    srand(static_cast<unsigned>(time(nullptr)));
    char buster[8];
    snprintf(buster, sizeof buster, "%d", rand() % 1000 + 1);
    const char *S = noCache ? buster : "";
    const std::string title = TitleOf(folderPath);
    const std::string version = WebUtils::GetModifyTime(kWebInterface);
    const char *V = version.c_str();
    const std::string checksum = IsHex(md5) ? md5 : "";
    const std::string path = ScriptEscaped(folderPath);
    fflush(stdout);  // the header is written straight to the descriptor
    cgi.WriteHeader("text/html; charset=\"UTF-8\"");

    printf("    <!DOCTYPE html>");
    puts("    <html>");
    puts("    <head>");
    puts("    \t<meta http-equiv='Content-Type' content='text/html; charset=utf-8'>");
    puts("        <meta http-equiv='X-UA-Compatible' content='IE=9' />");
    printf("\t\t<title>%s</title>\n", title.c_str());
    printf("\t\t<script type='text/javascript' src='%s/webman/quibdefs.cgi?v=%s'></script>\n", T, V);
    printf("\t\t<script type='text/javascript' src='%s/scripts/uistrings.cgi?lang=%s&%s'></script>\n", T,
           QuibCgiSelectDefLang(), V);
    printf("\t\t<script type='text/javascript' src='%s/norvo/webUI/uistrings.cgi?lang=%s&%s'></script>\n", T,
           QuibCgiSelectDefLang(), V);
    printf("\t\t<script type='text/javascript' src='%s/webman/uistrings.cgi?lang=%s&%s'></script>\n", T,
           QuibCgiSelectDefLang(), V);
    printf("    \t<script type='text/javascript'>var g_Lang = '%s';</script>\n", QuibCgiSelectDefLang());
    printf("    \t<script type='text/javascript'>var g_Tunnel = '%s';</script>\n", T);
    printf("    \t<script type='text/javascript'>var g_Version = '%s';</script>\n", V);
    printf("    \t<script type='text/javascript'>var g_MD5 = '%s';</script>\n", checksum.c_str());
    printf("    \t<script type='text/javascript'>var g_FolderPath = '%s';</script>\n", path.c_str());
    puts("    </head>");
    puts("<meta http-equiv='Content-Type' content='text/html; charset=utf-8'>");
    printf(
        "<link rel='stylesheet' type='text/css' href='%s/scripts/ext-3/resources/css/ext-all.css?v=%s%s' />\n",
        T, V, S);
    printf(
        "<link rel='stylesheet' type='text/css' href='%s/scripts/ext-3/resources/css/xtheme-gray-quib.css?v=%s%s' />\n",
        T, V, S);
    printf("<link rel='stylesheet' type='text/css' href='%s/webman/resources/css/desktop.css?v=%s%s' />\n", T,
           V, S);
    printf(
        "<link rel='stylesheet' type='text/css' href='%s/webman/resources/css/flexcrollstyles.css?v=%s%s' />\n",
        T, V, S);
    printf(
        "<link rel='stylesheet' type='text/css' href='%s/webman/modules/FileBrowser/style.css?v=%s%s' />\n",
        T, V, S);
    printf(
        "<link rel='stylesheet' type='text/css' href='%s/webman/modules/FileBrowser/norvo/folderSharing/style.css?v=%s%s' />\n",
        T, V, S);
    printf("<script type='text/javascript' src='%s/scripts/ext-3/adapter/ext/ext-base.js?%s%s'></script>\n",
           T, V, S);
    printf("<script type='text/javascript' src='%s/scripts/ext-3/ext-all.js?%s%s'></script>\n", T, V, S);
    printf("<script type='text/javascript' src='%s/scripts/ext-3/ux/ux-all.js?%s%s'></script>\n", T, V, S);
    printf("<script type='text/javascript' src='%s/scripts/scrollbar/flexcroll.js?v=%s%s'></script>\n", T, V,
           S);
    printf(
        "<script type='text/javascript' src='%s/webman/modules/FileBrowser/FolderSharingLoader.js?%s%s'></script>\n",
        T, V, S);
    puts("<body>");
    puts("</body></html>");
    fflush(stdout);
} catch (...) {
    // Only bad_alloc: the page stops where it was; no exception leaves the library.
}

}  // namespace NorvoLogin
