// The condition factory: request fields into search conditions. For any fields, the conditions
// made are the ones the documented rules give, each decides like the rule on a set of files
// made up around the request's own values, their records form one finite chain when joined,
// and deleting them frees everything (LeakSanitizer).
//
// Input: records separated by NUL. A record is one byte for the field ('0' + field; with the
// high bit set the operator is null), then the operator, a newline and the value; without a
// newline the value is null.
#include <limits.h>
#include <stddef.h>
#include <stdint.h>
#include <stdlib.h>
#include <string.h>
#include <strings.h>

#include <ctype.h>

#include <algorithm>
#include <random>
#include <set>
#include <string>
#include <vector>

#include "fuzz_appliance.h"
#include "norvo/errors.h"
#include "norvo/norvomisc.h"
#include "norvo/norvosearch.h"
#include "quib_user.h"

using FileSearch::FindComp;
using FileSearch::FindFactory;

namespace {

void Check(bool ok) {
    if (!ok) {
        __builtin_trap();
    }
}

// What one condition must decide, as the factory's rules describe it.
struct Expected {
    enum Kind { kName, kType, kUser, kGroup, kTime, kSize };
    explicit Expected(Kind k) : kind(k) {}
    Kind kind;
    std::vector<std::string> patterns;  // kName: any of them matches the base name
    bool dir = false;                   // kType
    unsigned id = 0;                    // kUser, kGroup
    int timeField = 0;                  // kTime: FIND_FIELD_MTIME, CRTIME or ATIME
    bool before = false;
    long when = 0;
    int sizeMode = 0;  // kSize: 1 equal, 2 greater, 3 less
    long long bytes = 0;
    size_t records = 1;  // condition records it owns
};

// Doubled backslashes become single ones; a term without wildcards (an escaped one anywhere
// makes it count as without) and not ending in a backslash is wrapped in stars; the test uses
// the first 493 bytes.
std::string PatternOf(const std::string &term) {
    std::string unescaped;
    for (size_t i = 0; i < term.size(); ++i) {
        unescaped += term[i];
        if (term[i] == '\\' && i + 1 < term.size() && term[i + 1] == '\\') {
            ++i;
        }
    }
    const auto none = [&unescaped](char wildcard) {
        return unescaped.find(std::string("\\") + wildcard) != std::string::npos ||
               unescaped.find(wildcard) == std::string::npos;
    };
    const bool wrap = none('*') && none('?') && (unescaped.empty() || unescaped.back() != '\\');
    const std::string pattern = wrap ? "*" + unescaped + "*" : unescaped;
    return pattern.substr(0, 493);
}

std::vector<std::string> Split(const std::string &value) {
    std::vector<std::string> out(1);
    for (char c : value) {
        if (c == ',') {
            out.emplace_back();
        } else {
            out.back() += c;
        }
    }
    return out;
}

std::string Trimmed(const std::string &text) {
    size_t begin = 0;
    size_t end = text.size();
    while (begin < end && isspace(static_cast<unsigned char>(text[begin])))
        ++begin;
    while (end > begin && isspace(static_cast<unsigned char>(text[end - 1])))
        --end;
    return text.substr(begin, end - begin);
}

Expected NameOf(std::vector<std::string> patterns) {
    Expected e{Expected::kName};
    e.records = patterns.size();
    e.patterns = std::move(patterns);
    return e;
}

// The names rule: a quoted term starts a condition, unquoted terms join the newest one, and
// unquoted terms before any quoted one form a condition only when no quoted term follows.
void ExpectNames(const std::string &value, std::vector<Expected> &out) {
    std::vector<std::string> pending;  // unquoted terms before the first quoted one
    bool quotedSeen = false;
    for (const std::string &piece : Split(value)) {
        const std::string term = Trimmed(piece);
        if (term.size() > 2 && term.front() == '"' && term.back() == '"') {
            out.push_back(NameOf({PatternOf(term.substr(1, term.size() - 2))}));
            quotedSeen = true;
        } else if (!term.empty()) {
            if (quotedSeen) {
                out.back().patterns.push_back(PatternOf(term));
                ++out.back().records;
            } else {
                pending.push_back(PatternOf(term));
            }
        }
    }
    if (!quotedSeen && !pending.empty()) {
        out.push_back(NameOf(pending));
    }
}

// 0 and the expected conditions when the call must succeed, else the error code it must set.
int ExpectField(int field, const char *op, const char *value, std::vector<Expected> &out) {
    const bool needsOp = field == FindFactory::FIND_FIELD_TYPE ||
                         (field >= FindFactory::FIND_FIELD_MTIME && field <= FindFactory::FIND_FIELD_SIZE);
    if ((field != FindFactory::FIND_FIELD_TYPE && value == nullptr) || (needsOp && op == nullptr)) {
        return NVO_ERR_GENERAL;
    }
    switch (field) {
        case FindFactory::FIND_FIELD_NAME:
            ExpectNames(value, out);
            break;
        case FindFactory::FIND_FIELD_TYPE:
            if (strcasecmp(op, "dir") == 0 || strcasecmp(op, "file") == 0) {
                Expected e{Expected::kType};
                e.dir = strcasecmp(op, "dir") == 0;
                out.push_back(e);
            }
            break;
        case FindFactory::FIND_FIELD_EXT: {
            Expected type{Expected::kType};
            out.push_back(type);
            std::vector<std::string> patterns;
            for (const std::string &piece : Split(value)) {
                patterns.push_back(PatternOf("*." + piece));
            }
            out.push_back(NameOf(patterns));
            break;
        }
        case FindFactory::FIND_FIELD_USER:
        case FindFactory::FIND_FIELD_GROUP: {
            const bool user = field == FindFactory::FIND_FIELD_USER;
            uid_t uid = 0;
            gid_t gid = 0;
            if (user ? QUIBUserGetUGID(value, &uid, &gid) < 0 : QUIBGroupGetGID(value, &gid) != 0) {
                return user ? NVO_ERR_NO_USER : NVO_ERR_NO_GROUP;
            }
            Expected e{user ? Expected::kUser : Expected::kGroup};
            e.id = user ? uid : gid;
            e.records = 2;
            out.push_back(e);
            break;
        }
        case FindFactory::FIND_FIELD_MTIME:
        case FindFactory::FIND_FIELD_CRTIME:
        case FindFactory::FIND_FIELD_ATIME: {
            Expected e{Expected::kTime};
            e.timeField = field;
            e.before = strcasecmp(op, "before") == 0;
            e.when = static_cast<long>(strtoull(value, nullptr, 10));
            out.push_back(e);
            break;
        }
        case FindFactory::FIND_FIELD_SIZE: {
            Expected e{Expected::kSize};
            e.sizeMode = strcmp(op, "equal") == 0 ? 1 : strcmp(op, "less") == 0 ? 3 : 2;
            e.bytes = static_cast<long long>(strtoull(value, nullptr, 10));
            e.records = e.sizeMode == 1 ? 2 : 1;
            out.push_back(e);
            break;
        }
        default:
            break;
    }
    return 0;
}

std::string BaseName(const std::string &path) {
    size_t end = path.size();
    while (end > 0 && path[end - 1] == '/')
        --end;
    size_t start = end;
    while (start > 0 && path[start - 1] != '/')
        --start;
    return path.substr(start, end - start);
}

bool Decide(const Expected &e, const std::string &path, const QUIBSTAT &st) {
    const unsigned type = st.st_mode & 0xF000;
    switch (e.kind) {
        case Expected::kName:
            for (const std::string &pattern : e.patterns) {
                if (NvoLibStrLikeCompare(pattern.c_str(), BaseName(path).c_str(), '\\') == 1) {
                    return true;
                }
            }
            return false;
        case Expected::kType:
            return type == (e.dir ? 0x4000u : 0x8000u);
        case Expected::kUser:
            return e.id != 0xFFFFFFFFu && st.st_uid == e.id;
        case Expected::kGroup:
            return e.id != 0xFFFFFFFFu && st.st_gid == e.id;
        case Expected::kTime: {
            const long t = e.timeField == FindFactory::FIND_FIELD_MTIME    ? st.st_mtim.tv_sec
                           : e.timeField == FindFactory::FIND_FIELD_CRTIME ? st.st_crtim.tv_sec
                                                                           : st.st_atim.tv_sec;
            return e.before ? t < e.when : t >= e.when;
        }
        case Expected::kSize: {
            const __int128 size = type == 0x4000 ? 0 : st.st_size;
            const __int128 bytes = e.bytes;
            if (e.sizeMode == 1) {
                // About that size: within a twentieth (at least 1) below and above, bounded by
                // 0 and the largest size.
                const __int128 d = std::max<long long>((e.bytes >> 2) / 5, 1);
                const __int128 low = std::max<__int128>(bytes - d, 0);
                const __int128 high = std::min<__int128>(bytes + d, LLONG_MAX);
                return low <= size && size < high;
            }
            return e.sizeMode == 3 ? size < bytes : size > bytes;
        }
    }
    return false;
}

// Files to judge: names made from the request's terms and a few others, sizes and times
// around its numbers, owners among its ids, of every kind.
struct Probe {
    std::string path;
    QUIBSTAT st;
};

std::vector<Probe> ProbesFor(const std::vector<Expected> &expected, std::mt19937_64 &rng) {
    std::vector<std::string> names = {"a.jpg", "Report 2012.PDF", ".hidden", "x", "\xC3\xA9t\xC3\xA9"};
    std::vector<long long> numbers = {0, 1, 1000, LLONG_MAX, -1};
    std::vector<unsigned> ids = {0, 1026, 65537, 0xFFFFFFFFu};
    for (const Expected &e : expected) {
        for (const std::string &pattern : e.patterns) {
            std::string literal;
            for (char c : pattern) {
                literal += c == '*' ? "ab" : c == '?' ? "z" : c == '\\' ? "" : std::string(1, c);
            }
            names.push_back(literal);
            names.push_back(pattern);
        }
        // Wrapping around is fine here: any number makes a probe.
        const auto plus = [](long long a, long long b) {
            return static_cast<long long>(static_cast<unsigned long long>(a) +
                                          static_cast<unsigned long long>(b));
        };
        for (long long n : {e.bytes, static_cast<long long>(e.when)}) {
            for (long long delta : {-6LL, -5LL, -1LL, 0LL, 1LL, 4LL, 5LL, -n / 20, n / 20}) {
                numbers.push_back(plus(n, delta));
            }
        }
        ids.push_back(e.id);
    }
    const unsigned kinds[] = {0x4000, 0x8000, 0xA000, 0x2000};
    std::vector<Probe> probes;
    for (int i = 0; i < 24; ++i) {
        Probe p{};
        p.path = "/volume1/share/" + names[rng() % names.size()] + (rng() % 4 == 0 ? "/" : "");
        p.st.st_mode = kinds[rng() % 4] | 0644;
        p.st.st_uid = ids[rng() % ids.size()];
        p.st.st_gid = ids[rng() % ids.size()];
        p.st.st_size = numbers[rng() % numbers.size()];
        p.st.st_atim.tv_sec = static_cast<int32_t>(numbers[rng() % numbers.size()]);
        p.st.st_mtim.tv_sec = static_cast<int32_t>(numbers[rng() % numbers.size()]);
        p.st.st_crtim.tv_sec = static_cast<int32_t>(numbers[rng() % numbers.size()]);
        probes.push_back(p);
    }
    return probes;
}

// Joins the conditions as a search does and walks every record from the first: the walk must
// end and meet exactly the records the conditions own.
void CheckChain(const std::vector<FindComp *> &made, size_t records) {
    if (made.empty()) {
        return;
    }
    for (size_t i = 0; i + 1 < made.size(); ++i) {
        (*made[i])(made[i + 1]);
    }
    std::set<const __tag_FI_SQL_COND *> seen;
    std::vector<const __tag_FI_SQL_COND *> todo = {made[0]->getFirstCond()};
    while (!todo.empty()) {
        const __tag_FI_SQL_COND *c = todo.back();
        todo.pop_back();
        if (c == nullptr || !seen.insert(c).second) {
            continue;
        }
        Check(seen.size() <= records && memchr(c->value, '\0', sizeof(c->value)) != nullptr);
        todo.push_back(c->andNext);
        todo.push_back(c->orNext);
    }
    Check(seen.size() == records);
}

}  // namespace

extern "C" int LLVMFuzzerInitialize(int *, char ***) {
    norvo::fuzz::BuildAppliance([](norvo::testing::Appliance &appliance) { appliance.Basic(); });
    return 0;
}

extern "C" int LLVMFuzzerTestOneInput(const uint8_t *data, size_t size) {
    const std::string input(reinterpret_cast<const char *>(data), size);
    std::vector<FindComp *> made;
    std::vector<Expected> expected;
    size_t start = 0;
    while (start < input.size()) {
        size_t end = input.find('\0', start);
        if (end == std::string::npos) {
            end = input.size();
        }
        const std::string record = input.substr(start, end - start);
        start = end + 1;
        if (record.empty()) {
            continue;
        }
        const auto head = static_cast<unsigned char>(record[0]);
        const int field = static_cast<int>(head & 0x7F) - '0';
        const size_t newline = record.find('\n');
        const std::string op =
            record.substr(1, newline == std::string::npos ? std::string::npos : newline - 1);
        const std::string value = newline == std::string::npos ? "" : record.substr(newline + 1);
        const char *opArg = (head & 0x80) != 0 ? nullptr : op.c_str();
        const char *valueArg = newline == std::string::npos ? nullptr : value.c_str();

        const size_t before = made.size();
        std::vector<Expected> want;
        const int code = ExpectField(field, opArg, valueArg, want);
        NvoLibSetErr(0);
        const bool ok = FindFactory::createFindOp(static_cast<FindFactory::_tag_FIND_FIELD_>(field), opArg,
                                                  valueArg, made);
        Check(ok == (code == 0) && NvoLibGetErr() == code);
        Check(made.size() - before == want.size());
        expected.insert(expected.end(), want.begin(), want.end());
    }
    for (FindComp *c : made) {
        Check(c != nullptr && c->getFirstCond() != nullptr);
    }

    std::mt19937_64 rng(std::hash<std::string>()(input));
    for (const Probe &p : ProbesFor(expected, rng)) {
        for (size_t i = 0; i < made.size(); ++i) {
            Check((*made[i])(p.path.c_str(), p.st) == Decide(expected[i], p.path, p.st));
        }
    }
    size_t records = 0;
    for (const Expected &e : expected) {
        records += e.records;
    }
    CheckChain(made, records);
    for (FindComp *c : made) {
        delete c;
    }
    return 0;
}
