// shares: the share list a user's file manager would show.
#include <string>

#include "accounts.h"
#include "handlers.h"
#include "norvo/errors.h"
#include "norvo/norvodir.h"
#include "output.h"
#include "records.h"

namespace norvo::cli {

int RunShares(const Invocation &inv) {
    const std::string &user = *inv.Value("user");
    const bool writable = inv.Has("writable");
    const bool sorted = inv.Has("sort");
    WarnIfUnknownUser(user);
    NvoLibSetErr(NVO_ERR_NONE);
    SzList shares(NvoLibValidShareGen(user.c_str(), sorted ? 1 : 0, writable ? 1 : 0));
    if (!shares) {
        return ReportLibraryFailure(inv);
    }

    Json::Value data(Json::objectValue);
    data["user"] = user;
    data["writable_only"] = writable;
    data["sorted"] = sorted;
    data["shares"] = Json::Value(Json::arrayValue);
    TextTable text;
    const int count = VLIBCSzListCount(shares.get());
    for (int i = 0; i < count; ++i) {
        const char *name = VLIBCSzListGet(shares.get(), i);
        if (name != nullptr) {
            data["shares"].append(name);
            text.Line(name);
        }
    }
    if (count == 0) {
        text.Line(writable ? "(no writable share)" : "(no share)");
    }
    return ReportSuccess(inv, data, text);
}

}  // namespace norvo::cli
