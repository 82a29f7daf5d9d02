// The multipart reader of uploads: what it yields does not depend on how the body is cut into
// pieces; a file name it yields never holds "/", a control byte or NUL, nor is "." or ".."; and
// parts encoded as a browser encodes them come back exactly.
//
// Input: the first byte picks the piece size; the rest is a body with boundary "B", and also,
// split at "\xFF\xFF" into parts of "FILENAME\xFEDATA", the parts to encode.
#include <stddef.h>
#include <stdint.h>
#include <stdlib.h>

#include <string>
#include <vector>

#include "multipart.h"

namespace {

using norvo::cgi::MultipartReader;
using norvo::cgi::Part;

struct Got {
    Part part;
    std::string data;
};

class Collect : public MultipartReader::Sink {
public:
    bool Begin(const Part &part) override {
        if (part.filename.find_first_of(std::string("/\0", 2)) != std::string::npos ||
            (part.file && !part.filename.empty() && !norvo::cgi::SafeFileName(part.filename)) ||
            part.name.empty()) {
            abort();
        }
        parts.push_back({part, ""});
        return true;
    }
    bool Data(const char *data, size_t size) override {
        parts.back().data.append(data, size);
        return true;
    }
    bool End() override { return true; }
    std::vector<Got> parts;
};

// The parts and the result of reading body in pieces of at most piece bytes.
std::pair<std::vector<Got>, MultipartReader::Result> Read(const std::string &boundary,
                                                          const std::string &body, size_t piece) {
    Collect sink;
    MultipartReader reader(boundary, &sink);
    MultipartReader::Result result = MultipartReader::kMore;
    for (size_t at = 0; at < body.size() && result == MultipartReader::kMore; at += piece) {
        result = reader.Feed(body.data() + at, std::min(piece, body.size() - at));
    }
    if (result == MultipartReader::kMore) {
        result = reader.Finish();
    }
    return {sink.parts, result};
}

bool Same(const std::vector<Got> &a, const std::vector<Got> &b) {
    if (a.size() != b.size()) {
        return false;
    }
    for (size_t i = 0; i < a.size(); ++i) {
        if (a[i].part.name != b[i].part.name || a[i].part.file != b[i].part.file ||
            a[i].part.filename != b[i].part.filename || a[i].data != b[i].data) {
            return false;
        }
    }
    return true;
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const uint8_t *bytes, size_t size) {
    if (size == 0) {
        return 0;
    }
    const size_t piece = 1 + bytes[0] % 61;
    const std::string body(reinterpret_cast<const char *>(bytes) + 1, size - 1);

    // Pieces change nothing: whole, then small.
    const auto whole = Read("B", body, body.size() + 1);
    const auto cut = Read("B", body, piece);
    if (whole.second != cut.second ||
        (whole.second != MultipartReader::kBad && !Same(whole.first, cut.first))) {
        abort();
    }

    // Round trip.
    std::vector<Got> parts;
    for (size_t at = 0; at <= body.size();) {
        size_t end = body.find("\xFF\xFF", at);
        end = end == std::string::npos ? body.size() : end;
        const std::string chunk = body.substr(at, end - at);
        const size_t mark = chunk.find('\xFE');
        Got got;
        got.part.name = "f" + std::to_string(parts.size());
        got.data = mark == std::string::npos ? chunk : chunk.substr(mark + 1);
        if (mark != std::string::npos && norvo::cgi::SafeFileName(chunk.substr(0, mark)) &&
            chunk.find_first_of("\"\\") >= mark) {
            got.part.file = true;
            got.part.filename = chunk.substr(0, mark);
        }
        parts.push_back(got);
        at = end + 2;
    }
    std::string boundary = "fz";
    for (int n = 0;; ++n) {
        bool clash = false;
        for (const Got &got : parts) {
            clash = clash || got.data.find("\r\n--" + boundary) != std::string::npos;
        }
        if (!clash) {
            break;
        }
        boundary = "fz" + std::to_string(n);
    }
    std::string encoded = "preamble\r\n";
    for (const Got &got : parts) {
        encoded += "--" + boundary + "\r\nContent-Disposition: form-data; name=\"" + got.part.name + "\"" +
                   (got.part.file ? "; filename=\"" + got.part.filename + "\"" : "") + "\r\n\r\n" + got.data +
                   "\r\n";
    }
    encoded += "--" + boundary + "--\r\nepilogue";
    const auto back = Read(boundary, encoded, piece);
    if (back.second != MultipartReader::kDone || !Same(back.first, parts) ||
        norvo::cgi::MultipartBoundary(("multipart/form-data; boundary=" + boundary).c_str()) != boundary) {
        abort();
    }
    return 0;
}
