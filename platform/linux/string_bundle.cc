// StringBundle: a string table of the web interface, read whole when opened and held by the
// bundle until it is destroyed.
#include <string.h>

#include <string>
#include <unordered_map>

#include "api_guard.h"
#include "locked_file.h"
#include "quib_cgi.h"
#include "quib_strings.h"
#include "settings_format.h"

namespace {

constexpr char kTextsRoot[] = "/usr/quib/quibman/webman/texts";

const char *ModuleFolder(int module) {
    return module == QUIB_STRINGS_FILE_MANAGER ? "filemanager" : nullptr;
}

// A section or language is one plain name: never a way out of the texts folder.
bool IsPlainName(const char *name) {
    return name != nullptr && name[0] != '\0' && strcmp(name, ".") != 0 && strcmp(name, "..") != 0 &&
           strlen(name) <= 64 &&
           strspn(name, "abcdefghijklmnopqrstuvwxyzABCDEFGHIJKLMNOPQRSTUVWXYZ0123456789_.-") == strlen(name);
}

}  // namespace

struct StringBundle::Impl {
    std::unordered_map<std::string, std::string> strings;
    std::string language;
    bool open = false;
};

StringBundle::StringBundle(int module, const char *section, const char *lang, const char *root,
                           const char *fallbackLang, const void *reserved1, const void *reserved2) {
    namespace np = norvo::platform;
    np::Guarded(0, [&] {
        impl_ = std::make_unique<Impl>();
        const char *folder = ModuleFolder(module);
        if (lang == nullptr) {
            lang = QuibCgiSelectDefLang();
        }
        if (fallbackLang == nullptr) {
            fallbackLang = "en";
        }
        if (folder == nullptr || !IsPlainName(section) || !IsPlainName(lang) || !IsPlainName(fallbackLang) ||
            reserved1 != nullptr || reserved2 != nullptr) {
            QUIB_SET_ERR(QUIB_ERR_BAD_PARAMETER);
            return 0;
        }
        const std::string base = root != nullptr ? root : kTextsRoot;
        for (const char *language : {lang, fallbackLang}) {
            std::string text;
            if (np::ReadWholeFile((base + "/" + language + "/" + folder + "/" + section).c_str(), &text) !=
                0) {
                continue;
            }
            for (const np::SettingsLine &line : np::ParseSettings(text)) {
                if (line.isEntry) {
                    impl_->strings.emplace(line.key, line.value);  // the first line of a key counts
                }
            }
            impl_->language = language;
            impl_->open = true;
            return 0;
        }
        QUIB_SET_ERR(QUIB_ERR_OPEN_FAILED);
        return 0;
    });
}

StringBundle::~StringBundle() = default;

bool StringBundle::IsOpen() const {
    return impl_ != nullptr && impl_->open;
}

const char *StringBundle::Get(const char *key) const {
    if (!IsOpen() || key == nullptr) {
        return nullptr;
    }
    auto found = impl_->strings.find(key);
    return found == impl_->strings.end() ? nullptr : found->second.c_str();
}

const char *StringBundle::Language() const {
    return IsOpen() ? impl_->language.c_str() : "";
}
