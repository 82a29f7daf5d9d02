// The factory: one request field (code, operator word, value) into conditions.
#include <ctype.h>
#include <stdlib.h>

#include <memory>
#include <new>
#include <string>

#include <json/value.h>

#include "errors/guard.h"
#include "norvo/errors.h"
#include "norvo/norvosearch.h"
#include "quib_user.h"
#include "quib_webapi.h"

namespace FileSearch {
namespace {

using Field = FindFactory::_tag_FIND_FIELD_;
using Conditions = std::vector<FindComp *>;

// Out of memory while building a condition: reported (401), unlike the silent cases, so a
// search does not quietly lose a condition.
struct OutOfMemory {};

template <typename T, typename... Args>
std::unique_ptr<T> Make(Args... args) {
    std::unique_ptr<T> made(new (std::nothrow) T(args...));
    if (!made || made->getFirstCond() == nullptr) {
        throw OutOfMemory();
    }
    return made;
}

// Appends made to out, which owns it from then on.
void Append(Conditions &out, std::unique_ptr<FindComp> made) {
    out.push_back(made.get());
    made.release();
}

bool Fail(int code) {
    NvoLibSetErr(code);
    return false;
}

bool NeedsOp(Field field) {
    switch (field) {
        case FindFactory::FIND_FIELD_TYPE:
        case FindFactory::FIND_FIELD_MTIME:
        case FindFactory::FIND_FIELD_CRTIME:
        case FindFactory::FIND_FIELD_ATIME:
        case FindFactory::FIND_FIELD_SIZE:
            return true;
        default:
            return false;
    }
}

Json::Value Split(const char *value) {
    Json::Value pieces;
    if (QUIB::WebAPIUtil::ParseToArray(value, pieces) != 0) {
        throw OutOfMemory();  // value is never null here
    }
    return pieces;
}

std::string Trimmed(const std::string &text) {
    size_t begin = 0;
    size_t end = text.size();
    while (begin < end && isspace(static_cast<unsigned char>(text[begin]))) {
        ++begin;
    }
    while (end > begin && isspace(static_cast<unsigned char>(text[end - 1]))) {
        --end;
    }
    return text.substr(begin, end - begin);
}

bool IsQuoted(const std::string &term) {
    return term.size() > 2 && term.front() == '"' && term.back() == '"';
}

// The name condition being built: its head, and whether out already holds (and owns) it.
class NameChain {
public:
    explicit NameChain(Conditions &out) : out_(out) {}
    ~NameChain() {
        if (!headInList_) {
            delete head_;
        }
    }
    NameChain(const NameChain &) = delete;
    NameChain &operator=(const NameChain &) = delete;

    void Join(std::unique_ptr<FindNameComp> term) {
        if (head_ == nullptr) {
            head_ = term.release();
        } else {
            head_->orComp(term.release());
        }
    }

    // A quoted term is a condition of its own: it replaces the head, and a head not yet in out
    // (made of unquoted terms) is dropped, so those terms have no effect. Intended.
    void StartQuoted(std::unique_ptr<FindNameComp> term) {
        out_.push_back(term.get());
        if (!headInList_) {
            delete head_;
        }
        head_ = term.release();
        headInList_ = true;
    }

    void Finish() {
        if (head_ != nullptr && !headInList_) {
            out_.push_back(head_);
            headInList_ = true;
        }
    }

private:
    Conditions &out_;
    FindNameComp *head_ = nullptr;
    bool headInList_ = false;
};

void AppendNames(const char *value, Conditions &out) {
    NameChain chain(out);
    for (const Json::Value &piece : Split(value)) {
        const std::string term = Trimmed(piece.asString());
        if (IsQuoted(term)) {
            chain.StartQuoted(Make<FindNameComp>(term.substr(1, term.size() - 2).c_str()));
        } else if (!term.empty()) {
            chain.Join(Make<FindNameComp>(term.c_str()));
        }
    }
    chain.Finish();
}

void AppendExtensions(const char *value, Conditions &out) {
    Append(out, Make<FindTypeComp>(false));
    NameChain chain(out);
    for (const Json::Value &piece : Split(value)) {
        chain.Join(Make<FindNameComp>(("*." + piece.asString()).c_str()));
    }
    chain.Finish();
}

// The value as strtoull reads it: digits up to the first other character, 0 for none.
unsigned long long NumberOf(const char *value) {
    return strtoull(value, nullptr, 10);
}

bool AppendField(Field field, const char *op, const char *value, Conditions &out) {
    switch (field) {
        case FindFactory::FIND_FIELD_NAME:
            AppendNames(value, out);
            return true;
        case FindFactory::FIND_FIELD_TYPE:
            if (std::unique_ptr<FindComp> type{FindTypeCompFactory::createFindTypeOpt(op)}) {
                Append(out, std::move(type));
            }
            return true;
        case FindFactory::FIND_FIELD_EXT:
            AppendExtensions(value, out);
            return true;
        case FindFactory::FIND_FIELD_USER: {
            uid_t uid = 0;
            gid_t gid = 0;
            if (QUIBUserGetUGID(value, &uid, &gid) < 0) {
                return Fail(NVO_ERR_NO_USER);
            }
            Append(out, Make<FindUserComp>(value, static_cast<unsigned int>(uid)));
            return true;
        }
        case FindFactory::FIND_FIELD_GROUP: {
            gid_t gid = 0;
            if (QUIBGroupGetGID(value, &gid) != 0) {
                return Fail(NVO_ERR_NO_GROUP);
            }
            Append(out, Make<FindGroupComp>(value, static_cast<unsigned int>(gid)));
            return true;
        }
        case FindFactory::FIND_FIELD_MTIME:
            Append(out, Make<FindMTimeComp>(op, static_cast<long>(NumberOf(value))));
            return true;
        case FindFactory::FIND_FIELD_CRTIME:
            Append(out, Make<FindCRTimeComp>(op, static_cast<long>(NumberOf(value))));
            return true;
        case FindFactory::FIND_FIELD_ATIME:
            Append(out, Make<FindATimeComp>(op, static_cast<long>(NumberOf(value))));
            return true;
        case FindFactory::FIND_FIELD_SIZE:
            Append(out, Make<FindSizeComp>(op, static_cast<long long>(NumberOf(value))));
            return true;
    }
    return true;  // a field this library does not know adds nothing
}

}  // namespace

bool FindFactory::createFindOp(_tag_FIND_FIELD_ field, const char *op, const char *value,
                               std::vector<FindComp *> &out) {
    return norvo::Guarded<bool>(false, [&]() -> bool {
        if (field != FIND_FIELD_TYPE && value == nullptr) {
            return Fail(NVO_ERR_GENERAL);
        }
        if (NeedsOp(field) && op == nullptr) {
            return Fail(NVO_ERR_GENERAL);
        }
        try {
            return AppendField(field, op, value, out);
        } catch (const OutOfMemory &) {
        } catch (const std::bad_alloc &) {
        }
        return Fail(NVO_ERR_SYSTEM);
    });
}

}  // namespace FileSearch
