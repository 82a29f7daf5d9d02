// The web interface's localised string tables: one key="value" file per language, module and
// section, /usr/quib/quibman/webman/texts/<language>/<module>/<section>.
#pragma once
#include <memory>

#include "platform_export.h"

// Module numbers of the tables.
enum {
    QUIB_STRINGS_FILE_MANAGER = 3,  // folder "filemanager"
};

class QUIB_API StringBundle {
public:
    // Reads the table of module and section in language lang (null: QuibCgiSelectDefLang()),
    // under root (null: /usr/quib/quibman/webman/texts), falling back to fallbackLang (null:
    // "en") when lang has no such table. reserved1 and reserved2 must be null. A table that
    // can't be read, or bad arguments, leave the bundle closed (IsOpen false, the slot set:
    // 0x0D00, 0x0900 for a missing table).
    StringBundle(int module, const char *section, const char *lang = nullptr, const char *root = nullptr,
                 const char *fallbackLang = nullptr, const void *reserved1 = nullptr,
                 const void *reserved2 = nullptr);
    ~StringBundle();
    StringBundle(const StringBundle &) = delete;
    StringBundle &operator=(const StringBundle &) = delete;

    bool IsOpen() const;
    // The string of key, owned by the bundle; null when the table lacks it or is closed.
    const char *Get(const char *key) const;
    // The language the table was read in ("" when closed).
    const char *Language() const;

private:
    struct Impl;
    std::unique_ptr<Impl> impl_;
};
