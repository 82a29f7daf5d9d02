#include "multipart.h"

#include <string.h>
#include <strings.h>

#include <map>
#include <utility>

namespace norvo::cgi {
namespace {

bool TokenChar(char c) {
    return c > 0x20 && c < 0x7F && strchr("()<>@,;:\\\"/[]?={}", c) == nullptr;
}

bool Control(const std::string &text) {
    for (const char c : text) {
        if (static_cast<unsigned char>(c) < 0x20 || c == 0x7F) {
            return true;
        }
    }
    return false;
}

void SkipSpace(const std::string &text, size_t *at) {
    while (*at < text.size() && (text[*at] == ' ' || text[*at] == '\t')) {
        ++*at;
    }
}

// "type; a=b; c="d"" into the lowered type and the parameters (lowered names); false when
// malformed or a parameter comes twice.
bool SplitParameters(const std::string &text, std::string *type, std::map<std::string, std::string> *params) {
    size_t at = 0;
    SkipSpace(text, &at);
    const size_t start = at;
    while (at < text.size() && (TokenChar(text[at]) || text[at] == '/')) {
        ++at;
    }
    *type = text.substr(start, at - start);
    for (char &c : *type) {
        c = static_cast<char>(tolower(static_cast<unsigned char>(c)));
    }
    for (;;) {
        SkipSpace(text, &at);
        if (at == text.size()) {
            return !type->empty();
        }
        if (text[at++] != ';') {
            return false;
        }
        SkipSpace(text, &at);
        std::string name;
        while (at < text.size() && TokenChar(text[at])) {
            name += static_cast<char>(tolower(static_cast<unsigned char>(text[at++])));
        }
        if (name.empty() || at == text.size() || text[at++] != '=') {
            return false;
        }
        std::string value;
        if (at < text.size() && text[at] == '"') {
            for (++at;; ++at) {
                if (at == text.size()) {
                    return false;
                }
                if (text[at] == '"') {
                    ++at;
                    break;
                }
                if (text[at] == '\\' && at + 1 < text.size()) {
                    ++at;
                }
                value += text[at];
            }
        } else {
            while (at < text.size() && TokenChar(text[at])) {
                value += text[at++];
            }
            if (value.empty()) {
                return false;
            }
        }
        if (!params->emplace(std::move(name), std::move(value)).second) {
            return false;
        }
    }
}

}  // namespace

std::string MultipartBoundary(const char *contentType) {
    std::string type;
    std::map<std::string, std::string> params;
    if (contentType == nullptr || !SplitParameters(contentType, &type, &params) ||
        type != "multipart/form-data") {
        return "";
    }
    const auto found = params.find("boundary");
    if (found == params.end()) {
        return "";
    }
    const std::string &b = found->second;
    static const char kSet[] = "0123456789ABCDEFGHIJKLMNOPQRSTUVWXYZabcdefghijklmnopqrstuvwxyz'()+_,-./:=? ";
    if (b.empty() || b.size() > 70 || b.back() == ' ' || strspn(b.c_str(), kSet) != b.size()) {
        return "";
    }
    return b;
}

bool SafeFileName(const std::string &name) {
    return !name.empty() && name.size() <= 255 && name.find('/') == std::string::npos && !Control(name) &&
           name != "." && name != "..";
}

MultipartReader::MultipartReader(const std::string &boundary, Sink *sink)
    // The body reads as if a line break came first, so the first delimiter may open it.
    : delimiter_("\r\n--" + boundary), sink_(sink), buf_("\r\n") {}

MultipartReader::Result MultipartReader::Feed(const char *data, size_t size) {
    if (state_ == kClosed || state_ == kFailed) {
        return state_ == kClosed ? kDone : kBad;
    }
    buf_.append(data, size);
    while (Step()) {
    }
    return state_ == kClosed ? kDone : state_ == kFailed ? kBad : kMore;
}

// One move on buf_; false when it needs more bytes or has stopped.
bool MultipartReader::Step() {
    switch (state_) {
        case kData: {
            const size_t at = buf_.find(delimiter_);
            const size_t take = at != std::string::npos            ? at
                                : buf_.size() >= delimiter_.size() ? buf_.size() - delimiter_.size() + 1
                                                                   : 0;
            if (take > 0 && inPart_ && !sink_->Data(buf_.data(), take)) {
                state_ = kFailed;
                return false;
            }
            if (at == std::string::npos) {
                buf_.erase(0, take);
                return false;
            }
            if (inPart_) {
                inPart_ = false;
                if (!sink_->End()) {
                    state_ = kFailed;
                    return false;
                }
            }
            buf_.erase(0, at + delimiter_.size());
            state_ = kDelimiterLine;
            return true;
        }
        case kDelimiterLine: {
            if (buf_.size() < 2) {
                return false;
            }
            if (buf_.compare(0, 2, "--") == 0) {
                state_ = kClosed;
                buf_.clear();
                return false;
            }
            size_t at = 0;
            SkipSpace(buf_, &at);  // transport padding
            if (at + 2 > buf_.size()) {
                if (buf_.size() > kMaxHeaderBytes || (at < buf_.size() && buf_[at] != '\r')) {
                    state_ = kFailed;
                }
                return false;
            }
            if (buf_[at] != '\r' || buf_[at + 1] != '\n') {
                state_ = kFailed;
                return false;
            }
            buf_.erase(0, at);  // the line break stays: the header block starts with one
            state_ = kHeaders;
            return true;
        }
        case kHeaders: {
            const size_t end = buf_.find("\r\n\r\n");
            if (end == std::string::npos || end > kMaxHeaderBytes) {
                if (end != std::string::npos || buf_.size() > kMaxHeaderBytes + 4) {
                    state_ = kFailed;
                }
                return false;
            }
            if (!StartPart(buf_.substr(2, end))) {
                state_ = kFailed;
                return false;
            }
            buf_.erase(0, end + 4);
            state_ = kData;
            return true;
        }
        default:
            return false;
    }
}

bool MultipartReader::StartPart(const std::string &block) {
    Part part;
    bool disposition = false;
    for (size_t at = 0; at < block.size();) {
        const size_t eol = block.find("\r\n", at);
        const std::string line = block.substr(at, eol - at);
        at = eol + 2;
        const size_t colon = line.find(':');
        if (eol == std::string::npos || Control(line) || colon == std::string::npos || colon == 0) {
            return false;
        }
        for (size_t i = 0; i < colon; ++i) {
            if (!TokenChar(line[i])) {
                return false;
            }
        }
        if (strncasecmp(line.c_str(), "Content-Disposition", colon) != 0 || colon != 19) {
            continue;
        }
        std::string type;
        std::map<std::string, std::string> params;
        if (disposition || !SplitParameters(line.substr(colon + 1), &type, &params) || type != "form-data") {
            return false;
        }
        disposition = true;
        const auto name = params.find("name");
        const auto filename = params.find("filename");
        if (name == params.end() || name->second.empty() || Control(name->second)) {
            return false;
        }
        part.name = name->second;
        if (filename != params.end()) {
            if (!filename->second.empty() && !SafeFileName(filename->second)) {
                return false;
            }
            part.file = true;
            part.filename = filename->second;
        }
    }
    if (!disposition || !sink_->Begin(part)) {
        return false;
    }
    inPart_ = true;
    return true;
}

}  // namespace norvo::cgi
