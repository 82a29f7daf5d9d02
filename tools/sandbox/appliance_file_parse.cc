#include <algorithm>
#include <cctype>
#include <map>
#include <set>
#include <utility>

#include "appliance_file.h"

#include "quib_paths.h"
#include "quib_share.h"

namespace norvo::testing {

namespace {

using Kind = ApplianceStep::Kind;

struct Token {
    std::string text;
    size_t equals = std::string::npos;  // first '=' outside quotes
    std::string Key() const { return text.substr(0, equals); }
    std::string Value() const { return text.substr(equals + 1); }
    bool IsOption() const { return equals != std::string::npos; }
};

// Why a line is rejected; carried up to the one place that adds the origin and line number.
struct LineError {
    std::string message;
};

// Splits a line into tokens. Double quotes group text with blanks and take the escapes \" \\ \n
// \t; outside quotes a backslash is an ordinary character, so CORP\dave needs no quoting. A '#'
// at the start of a token begins a comment.
std::vector<Token> Tokenize(std::string_view line) {
    std::vector<Token> tokens;
    size_t at = 0;
    for (;;) {
        while (at < line.size() && std::isspace(static_cast<unsigned char>(line[at])))
            ++at;
        if (at >= line.size() || line[at] == '#')
            return tokens;
        Token token;
        bool quoted = false;
        for (; at < line.size() && (quoted || !std::isspace(static_cast<unsigned char>(line[at]))); ++at) {
            const char c = line[at];
            if (c == '"') {
                quoted = !quoted;
            } else if (quoted && c == '\\') {
                if (++at >= line.size())
                    break;
                switch (line[at]) {
                    case '"':
                        token.text += '"';
                        break;
                    case '\\':
                        token.text += '\\';
                        break;
                    case 'n':
                        token.text += '\n';
                        break;
                    case 't':
                        token.text += '\t';
                        break;
                    default:
                        throw LineError{std::string("unknown escape '\\") + line[at] + "' in quotes"};
                }
            } else {
                if (!quoted && c == '=' && token.equals == std::string::npos)
                    token.equals = token.text.size();
                token.text += c;
            }
        }
        if (quoted)
            throw LineError{"unterminated quote"};
        tokens.push_back(std::move(token));
    }
}

struct Syntax {
    const char *name;
    Kind kind;
    int positionals;                   // leading arguments without '='
    std::vector<std::string> options;  // key=value arguments
    std::vector<std::string> flags;    // bare words
};

const std::vector<Syntax> &Directives() {
    static const std::vector<Syntax> directives = {
        {"basic", Kind::kBasic, 0, {}, {}},
        {"user", Kind::kUser, 1, {"password", "uid", "groups", "home", "expire"}, {}},
        {"admin", Kind::kAdmin, 1, {"password", "uid", "groups", "home", "expire"}, {}},
        {"group", Kind::kGroup, 1, {"gid", "members"}, {}},
        {"share",
         Kind::kShare,
         1,
         {"volume", "path", "rw", "ro", "noaccess", "restrict", "acl", "comment"},
         {"hidden", "encrypted"}},
        {"home", Kind::kHome, 1, {"root", "domain", "directory"}, {}},
        {"domain", Kind::kDomain, 1, {}, {}},
        {"directory", Kind::kDirectory, 1, {}, {}},
        {"setting", Kind::kSetting, 0, {}, {}},
        {"default-setting", Kind::kDefaultSetting, 0, {}, {}},
        {"privilege", Kind::kPrivilege, 2, {}, {}},
        {"volume", Kind::kVolume, 1, {}, {}},
        {"readonly", Kind::kReadOnly, 1, {}, {}},
        {"fat", Kind::kFat, 1, {}, {}},
        {"deadremote", Kind::kDeadRemote, 1, {}, {}},
        {"dir", Kind::kDir, 1, {"owner", "mode"}, {}},
        {"file", Kind::kFile, 1, {"owner", "mode", "size", "content"}, {}},
        {"link", Kind::kLink, 1, {"owner", "path", "avail", "exp"}, {}},
    };
    return directives;
}

bool Contains(const std::vector<std::string> &items, const std::string &item) {
    return std::find(items.begin(), items.end(), item) != items.end();
}

unsigned long long Number(const std::string &key, const std::string &text, unsigned long long max) {
    if (text.empty() || text.size() > 19 ||
        !std::all_of(text.begin(), text.end(), [](char c) { return c >= '0' && c <= '9'; }))
        throw LineError{"bad " + key + " '" + text + "' (a decimal number)"};
    const unsigned long long value = std::stoull(text);
    if (value > max)
        throw LineError{"bad " + key + " '" + text + "' (at most " + std::to_string(max) + ")"};
    return value;
}

mode_t Mode(const std::string &text) {
    if (text.size() < 3 || text.size() > 5 ||
        !std::all_of(text.begin(), text.end(), [](char c) { return c >= '0' && c <= '7'; }) ||
        std::stoul(text, nullptr, 8) > 07777)
        throw LineError{"bad mode '" + text + "' (octal, such as 0755)"};
    return mode_t(std::stoul(text, nullptr, 8));
}

bool YesNo(const std::string &key, const std::string &text) {
    if (text == "yes")
        return true;
    if (text == "no")
        return false;
    throw LineError{"bad " + key + " '" + text + "' (yes or no)"};
}

std::vector<std::string> List(const std::string &key, const std::string &text) {
    std::vector<std::string> items;
    size_t start = 0;
    for (;;) {
        const size_t comma = text.find(',', start);
        const std::string item =
            text.substr(start, comma == std::string::npos ? std::string::npos : comma - start);
        if (item.empty())
            throw LineError{"bad " + key + " '" + text + "' (names separated by commas)"};
        items.push_back(item);
        if (comma == std::string::npos)
            return items;
        start = comma + 1;
    }
}

std::string AbsolutePath(const std::string &text) {
    if (text.empty() || text[0] != '/')
        throw LineError{"'" + text + "' is not an absolute path"};
    return text;
}

unsigned Restrictions(const std::string &text) {
    unsigned bits = 0;
    for (const std::string &word : List("restrict", text)) {
        if (word == "nobrowse")
            bits |= SHARE_RESTRICT_NO_BROWSE;
        else if (word == "nomodify")
            bits |= SHARE_RESTRICT_NO_MODIFY;
        else if (word == "nodownload")
            bits |= SHARE_RESTRICT_NO_DOWNLOAD;
        else
            throw LineError{"unknown restriction '" + word + "' (nobrowse, nomodify, nodownload)"};
    }
    return bits;
}

// The names the file has made known so far, to check owners before anything is built.
struct KnownNames {
    std::map<std::string, int> users{{"root", 0}, {"nobody", 0}};
    std::set<std::string> groups{"root", "users", QUIB_ADMIN_GROUP, "nogroup"};

    void AddUser(const std::string &name, int line) {
        const auto [it, added] = users.emplace(name, line);
        if (!added)
            throw LineError{"user '" + name + "' is already defined" +
                            (it->second > 0 ? " on line " + std::to_string(it->second) : std::string())};
    }
    void CheckOwner(const std::string &owner) const {
        const size_t colon = owner.find(':');
        const std::string user = owner.substr(0, colon);
        if (users.count(user) == 0)
            throw LineError{"unknown owner '" + user + "'"};
        if (colon != std::string::npos && groups.count(owner.substr(colon + 1)) == 0)
            throw LineError{"unknown group '" + owner.substr(colon + 1) + "'"};
    }
};

class LineParser {
public:
    LineParser(const Syntax &syntax, const std::vector<Token> &tokens, int line, KnownNames &known)
        : syntax_(syntax), known_(known) {
        step_.kind = syntax.kind;
        step_.line = line;
        size_t next = 1;
        for (int i = 0; i < syntax.positionals; ++i, ++next) {
            if (next >= tokens.size() || tokens[next].IsOption())
                throw LineError{std::string(syntax.name) + " needs " + std::to_string(syntax.positionals) +
                                (syntax.positionals == 1 ? " argument" : " arguments")};
            positionals_.push_back(tokens[next].text);
        }
        for (; next < tokens.size(); ++next)
            arguments_.push_back(tokens[next]);
    }

    ApplianceStep Parse() {
        switch (syntax_.kind) {
            case Kind::kBasic:
                Basic();
                break;
            case Kind::kUser:
            case Kind::kAdmin:
                User();
                break;
            case Kind::kGroup:
                Group();
                break;
            case Kind::kShare:
                Share();
                break;
            case Kind::kHome:
                Home();
                break;
            case Kind::kDomain:
            case Kind::kDirectory:
                Options();
                step_.name = positionals_[0];
                break;
            case Kind::kSetting:
            case Kind::kDefaultSetting:
                Setting();
                break;
            case Kind::kPrivilege:
                Options();
                step_.name = positionals_[0];
                step_.value = positionals_[1];
                break;
            case Kind::kVolume:
            case Kind::kReadOnly:
            case Kind::kFat:
            case Kind::kDeadRemote:
                Options();
                step_.path = AbsolutePath(positionals_[0]);
                break;
            case Kind::kDir:
            case Kind::kFile:
                Node();
                break;
            case Kind::kLink:
                Link();
                break;
        }
        return step_;
    }

private:
    // The key=value arguments, checked against the directive's; flags land in flags_.
    std::map<std::string, std::string> Options() {
        std::map<std::string, std::string> options;
        for (const Token &token : arguments_) {
            if (!token.IsOption()) {
                if (!Contains(syntax_.flags, token.text))
                    throw LineError{"unexpected '" + token.text + "' for " + syntax_.name};
                flags_.insert(token.text);
                continue;
            }
            const std::string key = token.Key();
            if (!Contains(syntax_.options, key))
                throw LineError{"unknown option '" + key + "' for " + syntax_.name};
            if (!options.emplace(key, token.Value()).second)
                throw LineError{"option '" + key + "' given twice"};
        }
        return options;
    }

    void Link() {
        SharingLinkSpec &link = step_.link;
        link.id = positionals_[0];
        for (const auto &[key, value] : Options()) {
            if (key == "owner")
                link.owner = value;
            else if (key == "path")
                link.path = AbsolutePath(value);
            else if (key == "avail")
                link.availDate = std::to_string(Number(key, value, 9223372036854775807ULL));
            else if (key == "exp")
                link.expDate = std::to_string(Number(key, value, 9223372036854775807ULL));
        }
        if (link.owner.empty() || link.path.empty())
            throw LineError{"link needs owner= and path="};
        known_.CheckOwner(link.owner);
    }

    void Basic() {
        Options();
        for (const char *user : {"admin", "alice", "bob"})
            known_.AddUser(user, step_.line);
        known_.groups.insert("staff");
    }

    void User() {
        UserSpec &user = step_.user;
        user.name = positionals_[0];
        if (user.name.find_first_of(":,") != std::string::npos)
            throw LineError{"bad user name '" + user.name + "'"};
        for (const auto &[key, value] : Options()) {
            if (key == "password")
                user.password = value;
            else if (key == "uid")
                user.uid = uid_t(Number(key, value, 4294967294ULL));
            else if (key == "groups")
                user.groups = List(key, value);
            else if (key == "home")
                user.home = AbsolutePath(value);
            else if (key == "expire")
                user.expireDay = long(Number(key, value, 2147483647ULL));
        }
        if (step_.kind == Kind::kAdmin && !Contains(user.groups, QUIB_ADMIN_GROUP))
            user.groups.push_back(QUIB_ADMIN_GROUP);
        known_.AddUser(user.name, step_.line);
        known_.groups.insert(user.groups.begin(), user.groups.end());
    }

    void Group() {
        step_.group.name = positionals_[0];
        for (const auto &[key, value] : Options()) {
            if (key == "gid")
                step_.group.gid = gid_t(Number(key, value, 4294967294ULL));
            else if (key == "members")
                step_.group.members = List(key, value);
        }
        known_.groups.insert(step_.group.name);
    }

    void Share() {
        ShareSpec &share = step_.share;
        share.name = positionals_[0];
        for (const auto &[key, value] : Options()) {
            if (key == "volume")
                share.volume = AbsolutePath(value);
            else if (key == "path")
                share.path = AbsolutePath(value);
            else if (key == "rw")
                share.readWrite = value;
            else if (key == "ro")
                share.readOnly = value;
            else if (key == "noaccess")
                share.noAccess = value;
            else if (key == "restrict")
                share.restrict = Restrictions(value);
            else if (key == "acl")
                share.aclMode = YesNo(key, value);
            else if (key == "comment")
                share.comment = value;
        }
        share.hidden = flags_.count("hidden") != 0;
        share.encrypted = flags_.count("encrypted") != 0;
    }

    void Home() {
        const std::string &state = positionals_[0];
        if (state != "on" && state != "off")
            throw LineError{"bad home state '" + state + "' (on or off)"};
        step_.enabled = state == "on";
        step_.path = "/volume1/homes";
        for (const auto &[key, value] : Options()) {
            if (key == "root")
                step_.path = AbsolutePath(value);
            else if (key == "domain")
                step_.domain = YesNo(key, value);
            else if (key == "directory")
                step_.directory = YesNo(key, value);
        }
    }

    void Setting() {
        if (arguments_.size() != 1 || !arguments_[0].IsOption() || arguments_[0].Key().empty())
            throw LineError{std::string(syntax_.name) + " needs one KEY=VALUE"};
        step_.name = arguments_[0].Key();
        step_.value = arguments_[0].Value();
        if (step_.value.find_first_of("\"\n") != std::string::npos)
            throw LineError{"a setting's value can't hold a quote or a line break"};
    }

    void Node() {
        step_.path = AbsolutePath(positionals_[0]);
        step_.mode = step_.kind == Kind::kDir ? 0755 : 0644;
        const auto options = Options();
        for (const auto &[key, value] : options) {
            if (key == "owner") {
                known_.CheckOwner(value);
                step_.owner = value;
            } else if (key == "mode") {
                step_.mode = Mode(value);
            } else if (key == "size") {
                step_.size = (long long)Number(key, value, 1ULL << 32);
            } else if (key == "content") {
                step_.value = value;
            }
        }
        if (options.count("size") != 0 && options.count("content") != 0)
            throw LineError{"give either size or content, not both"};
    }

    const Syntax &syntax_;
    KnownNames &known_;
    ApplianceStep step_;
    std::vector<std::string> positionals_;
    std::vector<Token> arguments_;
    std::set<std::string> flags_;
};

}  // namespace

bool ParseApplianceFile(std::string_view text, const std::string &origin, ApplianceFile *file,
                        std::string *error) {
    ApplianceFile parsed;
    KnownNames known;
    int lineNumber = 0;
    for (size_t start = 0; start <= text.size();) {
        size_t end = text.find('\n', start);
        if (end == std::string_view::npos)
            end = text.size();
        const std::string_view line = text.substr(start, end - start);
        ++lineNumber;
        start = end + 1;
        try {
            const std::vector<Token> tokens = Tokenize(line);
            if (tokens.empty())
                continue;
            const auto &directives = Directives();
            const auto syntax = std::find_if(directives.begin(), directives.end(),
                                             [&](const Syntax &s) { return tokens[0].text == s.name; });
            if (syntax == directives.end())
                throw LineError{"unknown directive '" + tokens[0].text + "'"};
            parsed.steps.push_back(LineParser(*syntax, tokens, lineNumber, known).Parse());
        } catch (const LineError &failure) {
            *error = origin + ":" + std::to_string(lineNumber) + ": " + failure.message;
            return false;
        }
    }
    *file = std::move(parsed);
    return true;
}

}  // namespace norvo::testing
