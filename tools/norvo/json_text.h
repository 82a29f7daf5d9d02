// Writing a Json::Value as text, fast: one line, every character outside ASCII as \uXXXX.
#pragma once
#include <json/json.h>

#include <string>

namespace norvo::cli {

// Appends value as jsoncpp's StreamWriter writes it with no indentation and emitUTF8 off
// (members in key order, doubles to 17 significant digits with ".0" when they read as whole),
// byte for byte, but several times faster: a long listing spends most of its time here.
// Strings must be valid UTF-8 (see MakeJsonSafe).
void AppendJson(std::string &out, const Json::Value &value);

}  // namespace norvo::cli
