// The key="value" settings files. In memory: the text renders back byte for byte, and every
// entry written again in either format reads back the same. On a file (in the appliance's
// private /tmp): what VLIBCFileSetKeyValue wrote, VLIBCFileGetKeyValue returns; no other key
// changes and no other line moves; a refused value leaves the file as it was; removing the key
// again leaves every other key as it was.
//
// Input: the format digit ('0' quoted, '1' bare), the key, a newline, the value, a newline,
// the file's text.
#include <fcntl.h>
#include <stddef.h>
#include <stdint.h>
#include <string.h>
#include <unistd.h>

#include <algorithm>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

#include "fuzz_appliance.h"
#include "settings_format.h"
#include "vlibc_err.h"
#include "vlibc_file.h"
#include "vlibc_szlist.h"

namespace np = norvo::platform;

namespace {

constexpr const char *kFile = "/tmp/fuzz/settings.conf";

void Check(bool ok) {
    if (!ok) {
        __builtin_trap();
    }
}

void WriteText(const std::string &text) {
    const int fd = open(kFile, O_WRONLY | O_CREAT | O_TRUNC | O_CLOEXEC, 0644);
    Check(fd >= 0);
    Check(write(fd, text.data(), text.size()) == static_cast<ssize_t>(text.size()));
    close(fd);
}

std::string ReadText() {
    std::string text;
    const int fd = open(kFile, O_RDONLY | O_CLOEXEC);
    Check(fd >= 0);
    char buf[4096];
    ssize_t n;
    while ((n = read(fd, buf, sizeof(buf))) > 0) {
        text.append(buf, static_cast<size_t>(n));
    }
    close(fd);
    return text;
}

// The keys readers see and their values, in file order, through the platform's own call.
std::vector<std::pair<std::string, std::string>> Entries() {
    PSZLIST keys = VLIBCSzListAlloc(16);
    PSZLIST values = VLIBCSzListAlloc(16);
    Check(keys != nullptr && values != nullptr);
    const int count = VLIBCFileGetKeys(kFile, &keys, &values);
    Check(count >= 0 && count == VLIBCSzListCount(keys) && count == VLIBCSzListCount(values));
    std::vector<std::pair<std::string, std::string>> out;
    for (int i = 0; i < count; ++i) {
        out.emplace_back(VLIBCSzListGet(keys, i), VLIBCSzListGet(values, i));
    }
    VLIBCSzListFree(keys);
    VLIBCSzListFree(values);
    return out;
}

// The lines that are not entries of key, without their endings: a last line without one gains
// one when a key is appended, and a CR it ended with becomes part of that ending (CRs at the
// end of a line are not compared).
std::vector<std::string> OtherLines(const std::string &text, const std::string &key) {
    std::vector<std::string> out;
    for (const np::SettingsLine &line : np::ParseSettings(text)) {
        if (!np::KeyMatches(line, key, false)) {
            out.push_back(line.text);
            while (!out.back().empty() && out.back().back() == '\r') {
                out.back().pop_back();
            }
        }
    }
    return out;
}

// Entries as they are after setting key to value: key's first place keeps it, or it comes last.
std::vector<std::pair<std::string, std::string>> WithKey(
    std::vector<std::pair<std::string, std::string>> entries, const std::string &key,
    const std::string &value) {
    for (auto &entry : entries) {
        if (entry.first == key) {
            entry.second = value;
            return entries;
        }
    }
    entries.emplace_back(key, value);
    return entries;
}

void CheckInMemory(const std::string &text) {
    const std::vector<np::SettingsLine> lines = np::ParseSettings(text);
    Check(np::RenderSettings(lines) == text);
    for (const np::SettingsLine &line : lines) {
        if (!line.isEntry || !np::IsWritableKey(line.key)) {
            continue;
        }
        for (int format = 0; format < 2; ++format) {
            if (!np::IsWritableValue(line.value, format)) {
                continue;
            }
            const std::vector<np::SettingsLine> again =
                np::ParseSettings(np::FormatEntry(line.key, line.value, format));
            Check(again.size() == 1 && again[0].isEntry && again[0].key == line.key &&
                  again[0].value == line.value);
        }
    }
}

}  // namespace

extern "C" int LLVMFuzzerInitialize(int *, char ***) {
    norvo::fuzz::BuildAppliance([](norvo::testing::Appliance &appliance) { appliance.MakeDir("/tmp/fuzz"); });
    return 0;
}

extern "C" int LLVMFuzzerTestOneInput(const uint8_t *data, size_t size) {
    if (size == 0) {
        return 0;
    }
    const int format = data[0] & 1;
    const std::string input(reinterpret_cast<const char *>(data) + 1, size - 1);
    const size_t keyEnd = input.find('\n');
    const size_t valueEnd = keyEnd == std::string::npos ? std::string::npos : input.find('\n', keyEnd + 1);
    if (valueEnd == std::string::npos) {
        return 0;
    }
    // The calls take C strings: key and value end at a NUL.
    std::string key = input.substr(0, keyEnd);
    key = key.substr(0, key.find('\0'));
    std::string value = input.substr(keyEnd + 1, valueEnd - keyEnd - 1);
    value = value.substr(0, value.find('\0'));
    const std::string text = input.substr(valueEnd + 1);

    CheckInMemory(text);

    WriteText(text);
    const auto before = Entries();
    // Every reader sees the same value for each key the file lists.
    for (const auto &[k, v] : before) {
        std::string got(v.size() + 1, 'x');
        Check(VLIBCFileGetKeyValue(kFile, k.c_str(), got.data(), got.size(), 0) ==
              static_cast<int>(v.size() + 1));
        Check(got.compare(0, v.size(), v) == 0 &&
              VLIBCFileCheckKeyValue(kFile, k.c_str(), v.c_str(), 0) == 1);
    }
    const bool writable = np::IsWritableKey(key) && np::IsWritableValue(value, format);
    const int set = VLIBCFileSetKeyValue(kFile, key.c_str(), value.c_str(), format);
    if (!writable) {
        Check(set == -1 && VLIBCErrGet() == QUIB_ERR_BAD_PARAMETER);
        Check(ReadText() == text);
        return 0;
    }
    Check(set == 0);
    const std::string written = ReadText();
    Check(OtherLines(written, key) == OtherLines(text, key));
    Check(Entries() == WithKey(before, key, value));
    std::string buf(value.size() + 1, 'x');
    Check(VLIBCFileGetKeyValue(kFile, key.c_str(), buf.data(), buf.size(), 0) ==
          static_cast<int>(value.size() + 1));
    Check(memcmp(buf.data(), value.data(), value.size()) == 0 && buf[value.size()] == '\0');
    Check(VLIBCFileCheckKeyValue(kFile, key.c_str(), value.c_str(), 0) == 1);

    // Setting it again changes nothing at all.
    Check(VLIBCFileSetKeyValue(kFile, key.c_str(), value.c_str(), format) == 0);
    Check(ReadText() == written);

    Check(VLIBCFileRemoveKey(kFile, key.c_str()) == 0);
    auto expected = before;
    expected.erase(std::remove_if(expected.begin(), expected.end(),
                                  [&key](const auto &entry) { return entry.first == key; }),
                   expected.end());
    Check(Entries() == expected);
    Check(OtherLines(ReadText(), key) == OtherLines(text, key));
    return 0;
}
