#include "share_config.h"

#include <map>

#include "name_list.h"
#include "parsed_file.h"
#include "quib_paths.h"
#include "quib_share.h"
#include "text_util.h"

namespace norvo::platform {

namespace {

// A [section] while its lines are read.
struct Section {
    ShareEntry share;
    bool hasName = false;
    bool broken = false;
    bool hasPath = false;
};

bool IsCommentLine(std::string_view trimmed) {
    return !trimmed.empty() && (trimmed.front() == ';' || trimmed.front() == '#');
}

// Physical lines joined at trailing backslashes, comments and blank lines dropped.
std::vector<std::string> LogicalLines(std::string_view text) {
    std::vector<std::string> lines;
    std::string pending;
    bool continuing = false;
    size_t pos = 0;
    while (pos <= text.size()) {
        size_t nl = text.find('\n', pos);
        if (nl == std::string_view::npos) {
            nl = text.size();
        }
        std::string_view line = text.substr(pos, nl - pos);
        pos = nl + 1;
        if (!line.empty() && line.back() == '\r') {
            line.remove_suffix(1);
        }
        std::string_view trimmed = TrimSpace(line);
        if (!continuing && (trimmed.empty() || IsCommentLine(trimmed))) {
            continue;
        }
        // Spaces after the backslash are forgiven: they are invisible in an editor.
        std::string_view body = line;
        while (!body.empty() && (body.back() == ' ' || body.back() == '\t')) {
            body.remove_suffix(1);
        }
        if (!body.empty() && body.back() == '\\') {
            body.remove_suffix(1);
            pending += body;
            continuing = true;
            continue;
        }
        pending += line;
        continuing = false;
        lines.push_back(std::move(pending));
        pending.clear();
    }
    if (continuing && !TrimSpace(pending).empty()) {
        lines.push_back(std::move(pending));
    }
    return lines;
}

// "Write   List" and "write list" are the same key; "writelist" is another.
std::string NormalizeKey(std::string_view key) {
    std::string out;
    bool space = false;
    for (char c : TrimSpace(key)) {
        if (IsSpaceByte(c)) {
            space = true;
            continue;
        }
        if (space && !out.empty()) {
            out += ' ';
        }
        space = false;
        out += c;
    }
    return ToLowerAscii(out);
}

bool SetFlag(std::string_view value, unsigned bit, bool whenTrue, unsigned *flags) {
    bool on = false;
    if (!ParseBool(value, &on)) {
        return false;
    }
    if (on == whenTrue) {
        *flags |= bit;
    } else {
        *flags &= ~bit;
    }
    return true;
}

bool HasOddQuotes(std::string_view text) {
    size_t quotes = 0;
    for (char c : text) {
        quotes += c == '"' ? 1 : 0;
    }
    return quotes % 2 != 0;
}

// Keys are plain ASCII words; anything else is damage, and an unknown key is ignored, so a
// damaged "invalid users" must not simply vanish.
bool IsPlainKey(std::string_view key) {
    for (char c : key) {
        if (c < ' ' || c > '~' || c == '"') {  // a char above 0x7F is negative: refused too
            return false;
        }
    }
    return !key.empty();
}

// Applies one key; false when the value of a known key is invalid. An unbalanced quote
// anywhere, or any quote in a path, makes the value invalid: in a list it would swallow the
// entries after it.
bool ApplyKey(const std::string &key, std::string_view value, Section *section) {
    ShareEntry &share = section->share;
    if (!IsPlainKey(key) || HasOddQuotes(value)) {
        return false;
    }
    if (key == "path") {
        if (value.find('"') != std::string_view::npos) {
            return false;
        }
        std::string path = NormalizePath(value);
        if (path.empty() || path == "/") {
            return false;
        }
        share.path = path;
        section->hasPath = true;
    } else if (key == "comment") {
        share.comment = std::string(value);
    } else if (key == "invalid users") {
        share.noAccess = NormalizeNameList(value);
    } else if (key == "write list") {
        share.readWrite = NormalizeNameList(value);
    } else if (key == "read list") {
        share.readOnly = NormalizeNameList(value);
    } else if (key == "browseable" || key == "browsable") {
        return SetFlag(value, SHARE_STATUS_HIDDEN, false, &share.status);
    } else if (key == "encrypted") {
        return SetFlag(value, SHARE_STATUS_ENCRYPTED, true, &share.status);
    } else if (key == "disable browsing") {
        return SetFlag(value, SHARE_RESTRICT_NO_BROWSE, true, &share.restrict);
    } else if (key == "disable modify") {
        return SetFlag(value, SHARE_RESTRICT_NO_MODIFY, true, &share.restrict);
    } else if (key == "disable download") {
        return SetFlag(value, SHARE_RESTRICT_NO_DOWNLOAD, true, &share.restrict);
    } else if (key == "ftp privilege") {
        std::string word = ToLowerAscii(value);
        if (word == "none") {
            share.ftpPrivilege = 0;
        } else if (word == "ro") {
            share.ftpPrivilege = 1;
        } else if (word == "rw") {
            share.ftpPrivilege = 2;
        } else {
            return false;
        }
    } else if (key == "acl") {
        bool on = true;
        if (!ParseBool(value, &on)) {
            return false;
        }
        share.aclMode = on;
    } else if (key == "synced") {
        return ParseBool(value, &share.synced);
    }
    return true;
}

bool IsGlobal(const Section &section) {
    return EqualsIgnoreCase(section.share.name, "global");
}

// Opens a section from a "[name]" line; anything after the closing bracket is ignored.
Section OpenSection(std::string_view line) {
    Section section;
    size_t close = line.find(']');
    if (close == std::string_view::npos) {
        section.broken = true;
        return section;
    }
    std::string name(TrimSpace(line.substr(1, close - 1)));
    if (!IsAcceptableName(name.c_str()) || name.find('/') != std::string::npos ||
        name.find('"') != std::string::npos) {
        section.broken = true;
        return section;
    }
    section.share.name = name;
    section.hasName = true;
    return section;
}

}  // namespace

std::vector<ShareEntry> ParseShareConfig(std::string_view text) {
    // An editor's byte-order mark must not turn the first section header into a stray line.
    constexpr std::string_view kByteOrderMark = "\xEF\xBB\xBF";
    if (text.substr(0, kByteOrderMark.size()) == kByteOrderMark) {
        text.remove_prefix(kByteOrderMark.size());
    }
    std::vector<Section> sections;
    for (const std::string &raw : LogicalLines(text)) {
        std::string_view line = TrimSpace(raw);
        if (line.empty() || IsCommentLine(line)) {
            continue;
        }
        if (line.front() == '[') {
            sections.push_back(OpenSection(line));
            sections.back().broken |= !IsCleanConfigText(raw);
            continue;
        }
        if (sections.empty()) {
            continue;  // before the first section: belongs to no share
        }
        Section &section = sections.back();
        if (section.broken) {
            continue;
        }
        size_t eq = line.find('=');
        // raw, not line: trimming would hide a vertical tab or form feed that replaced a byte.
        if (eq == std::string_view::npos || !IsCleanConfigText(raw)) {
            section.broken = true;
            continue;
        }
        if (!ApplyKey(NormalizeKey(line.substr(0, eq)), TrimSpace(line.substr(eq + 1)), &section)) {
            section.broken = true;
        }
    }

    std::map<std::string, int> uses;  // lower-cased name -> sections so named
    for (const Section &section : sections) {
        if (section.hasName && !IsGlobal(section)) {
            ++uses[ToLowerAscii(section.share.name)];
        }
    }
    std::vector<ShareEntry> shares;
    for (Section &section : sections) {
        if (!section.hasName || section.broken || !section.hasPath || IsGlobal(section) ||
            uses[ToLowerAscii(section.share.name)] != 1) {
            continue;
        }
        shares.push_back(std::move(section.share));
    }
    return shares;
}

const ShareEntry *ShareTable::Find(std::string_view name) const {
    const auto found = byLowerName.find(ToLowerAscii(name));
    return found == byLowerName.end() ? nullptr : &shares[found->second];
}

ShareTable MakeShareTable(std::string_view text) {
    ShareTable table;
    table.shares = ParseShareConfig(text);
    for (size_t i = 0; i < table.shares.size(); ++i) {
        table.byLowerName.emplace(ToLowerAscii(table.shares[i].name), i);  // names are unique
    }
    return table;
}

int CurrentShares(std::shared_ptr<const ShareTable> *table) {
    static ParsedFile<ShareTable> file(QUIB_SHARE_CONF, MakeShareTable);
    return file.Get(table);
}

}  // namespace norvo::platform
