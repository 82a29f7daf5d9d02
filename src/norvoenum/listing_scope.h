// What a directory listing tells FillFileInfo while it reads one directory: the listing sets
// the user and real paths of the records it keeps itself, once the page is cut, so the records
// the page drops never build them.
#pragma once

namespace norvo {

class ListingScope {
public:
    ListingScope();
    ~ListingScope();
    ListingScope(const ListingScope &) = delete;
    ListingScope &operator=(const ListingScope &) = delete;

    // Whether a listing on this thread fills the paths later.
    static bool PathsDeferred();

private:
    bool outer_;
};

}  // namespace norvo
