// A streaming reader of multipart/form-data request bodies (RFC 7578 on RFC 2046): the body is
// fed in pieces of any size and the parts' data go out as they arrive, so memory stays bounded
// by the piece plus one delimiter and one part's header block (kMaxHeaderBytes).
#pragma once
#include <stddef.h>

#include <string>

namespace norvo::cgi {

constexpr size_t kMaxHeaderBytes = 8192;

// The boundary of a "multipart/form-data; boundary=..." Content-Type (type and parameter names
// in any case, the value a token or a quoted string); "" when the type is another, or the
// boundary is missing, repeated, or not 1 to 70 characters of RFC 2046's set.
std::string MultipartBoundary(const char *contentType);

// A file name a part may carry into a folder: 1 to 255 bytes, no "/", no control byte or DEL,
// not "." or "..".
bool SafeFileName(const std::string &name);

struct Part {
    std::string name;      // the form field's name: no control byte or DEL
    bool file = false;     // the part has a filename parameter
    std::string filename;  // then SafeFileName, or "" (a form's empty file input)
};

class MultipartReader {
public:
    enum Result { kMore, kDone, kBad };
    // Receives the parts in order; returning false stops the reader (kBad from then on).
    class Sink {
    public:
        virtual ~Sink() = default;
        virtual bool Begin(const Part &part) = 0;
        virtual bool Data(const char *data, size_t size) = 0;
        virtual bool End() = 0;
    };

    MultipartReader(const std::string &boundary, Sink *sink);
    // kMore while the body goes on; kDone from the closing delimiter on (the epilogue is
    // ignored); kBad once the body is malformed or the sink refused.
    Result Feed(const char *data, size_t size);
    // What the body amounts to when it ends here: kDone, or kBad for a body cut short.
    Result Finish() const { return state_ == kClosed ? kDone : kBad; }
    // Whether a part had begun and not ended when the reader stopped.
    bool InPart() const { return inPart_; }

private:
    enum State { kData, kDelimiterLine, kHeaders, kClosed, kFailed };
    bool Step();
    bool StartPart(const std::string &block);

    std::string delimiter_;  // "\r\n--" boundary
    Sink *sink_;
    std::string buf_;
    State state_ = kData;
    bool inPart_ = false;
};

}  // namespace norvo::cgi
