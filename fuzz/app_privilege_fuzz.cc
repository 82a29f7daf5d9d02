// The application privilege file fails closed: damage to the value of an intact line (a
// control byte, a stray quote, a byte that breaks UTF-8) never grants a user a privilege the
// intact line did not. The input builds the intact file and then chooses the damage; the raw
// input is also decided on as a whole file, where only "no crash" is asked.
#include <stddef.h>
#include <stdint.h>
#include <stdlib.h>

#include <string>
#include <string_view>
#include <vector>

#include "app_privilege.h"
#include "damage.h"
#include "name_list.h"
#include "settings_format.h"

namespace {

using norvo::fuzz::DamageValues;
using norvo::fuzz::Input;
using norvo::platform::ListMatcher;
using norvo::platform::ParseSettings;
using norvo::platform::PrivilegeVerdict;

// Host accounts every Linux has ("root", group "root"), and names NSS does not know.
const char *const kUsers[] = {"root", "alice", "carol"};
const char *const kHolders[] = {"root",  "alice",  "carol",  "@root",
                                "!root", "!carol", "!@root", "\"@CORP\\domain users\""};
const char *const kPrivileges[] = {"P.One", "P.Two"};

// The quoted form the writers produce, escaping quotes and backslashes.
std::string Quoted(const std::string &holders) {
    std::string out = "\"";
    for (char c : holders) {
        if (c == '"' || c == '\\')
            out += '\\';
        out += c;
    }
    return out + "\"";
}

struct Text {
    std::string text;
    std::vector<std::pair<size_t, size_t>> values;  // where each value lies in text
};

Text IntactFile(Input *in) {
    Text out;
    out.text = "# application privileges\n";
    for (const char *privilege : kPrivileges) {
        const uint8_t pick = in->Byte();
        const uint8_t form = in->Byte();
        std::string holders;
        for (size_t h = 0; h < sizeof kHolders / sizeof *kHolders; ++h) {
            if (pick & (1u << h))
                holders += (holders.empty() ? "" : ",") + std::string(kHolders[h]);
        }
        std::string value;
        switch (form % 3) {
            case 0:
                value = Quoted(holders);
                break;
            case 1:
                value = holders;
                break;  // bare
            default:
                value = "'" + holders + "'";
        }
        out.text += std::string(privilege) + (form & 4 ? " = " : "=");
        out.values.emplace_back(out.text.size(), value.size());
        out.text += value + (form & 8 ? " # note\n" : "\n");
    }
    return out;
}

int Verdict(const std::string &text, const char *privilege, const char *user) {
    ListMatcher matcher(user);
    return PrivilegeVerdict(ParseSettings(text), privilege, &matcher);
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const uint8_t *data, size_t size);

extern "C" int LLVMFuzzerTestOneInput(const uint8_t *data, size_t size) {
    const std::string raw(reinterpret_cast<const char *>(data), size);
    for (const char *privilege : kPrivileges)
        (void)Verdict(raw, privilege, "root");

    Input in(data, size);
    const Text intact = IntactFile(&in);
    const std::string damaged = DamageValues(intact.text, intact.values, &in);
    for (const char *privilege : kPrivileges) {
        for (const char *user : kUsers) {
            if (Verdict(damaged, privilege, user) == 1 && Verdict(intact.text, privilege, user) != 1)
                abort();
        }
    }
    return 0;
}
