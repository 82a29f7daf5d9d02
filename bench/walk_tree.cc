// Makes the tree that scripts/bench-walk.sh walks: the shape of a family photo and office
// document share. ENTRIES entries in all (folders, files and links; default 1,000,000), about 6%
// of them folders, depths up to 12: Photos/<year>/<month>/<event>/..., Documents, Scans, Backup
// and Videos with nested project folders; files per folder heavy-tailed (a few folders hold
// thousands of photos, most a handful). On top of that a few hidden "@eaDir" folders (which a
// walk passes over, so they are not in ENTRIES), and a few symbolic links to folders and files.
// The deepest entries are 12 levels below DIR. The same ENTRIES and SEED make the same tree. Everything is
// created relative to descriptors.
//   walk_tree DIR [ENTRIES [SEED]]      (DIR must not exist)
// Prints one line: entries, folders, files, links, hidden folders, deepest level.
#include <errno.h>
#include <fcntl.h>
#include <stdio.h>
#include <stdlib.h>
#include <string.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <cmath>
#include <cstdint>
#include <random>
#include <string>
#include <unordered_set>
#include <vector>

namespace {

constexpr int kMaxDepth = 11;  // of folders; their entries are one level deeper
constexpr int kFirstYear = 2005;
constexpr int kYears = 20;

// What a folder is, which decides how its children and files are named.
enum class Kind { kRoot, kPhotos, kYear, kMonth, kEvent, kEventPart, kDocuments, kProject, kScans };

struct Folder {
    int parent;
    int depth;
    Kind kind;
    int year;
    int month;
    std::string name;  // fixed for the skeleton, chosen when created for the rest
    std::vector<int> children;
    int files = 0;
    int links = 0;
    bool hidden = false;  // holds an "@eaDir"
};

[[noreturn]] void Die(const char *what, const std::string &name) {
    fprintf(stderr, "walk_tree: %s %s: %s\n", what, name.c_str(), strerror(errno));
    exit(1);
}

// The generator's own draws, so the tree does not depend on how a library maps random bits.
class Rng {
public:
    explicit Rng(uint64_t seed) : engine_(seed) {}
    uint64_t Below(uint64_t n) { return engine_() % n; }
    double Unit() { return static_cast<double>((engine_() >> 11) + 1) / 9007199254740993.0; }  // (0, 1]
    template <typename T, size_t N>
    const T &Pick(const T (&items)[N]) {
        return items[Below(N)];
    }

private:
    std::mt19937_64 engine_;
};

const char *const kEvents[] = {
    "Birthday Anna", "Beach",          "Christmas", "Wedding Tom & Lisa", "Hiking",    "Zoo",     "Garden",
    "Paris",         "School concert", "Easter",    "Ski trip",           "New house", "Grandma", "Football"};
const char *const kEventParts[] = {"Edited", "RAW", "Selected", "Export", "Print", "Phone", "Camera 2"};
const char *const kProjects[] = {"Projects", "Archive", "Contracts",     "Drafts",  "Old",    "Final",
                                 "Invoices", "Letters", "Meeting notes", "Reports", "Images", "Misc"};
const char *const kDocumentStems[] = {"Report", "Minutes", "Offer", "Budget", "Contract", "Letter", "Notes"};
const char *const kDocumentExtensions[] = {".pdf", ".docx", ".xlsx", ".pdf", ".txt", ".pptx", ".odt"};
const char *const kTopLevel[] = {"Documents", "Scans", "Backup", "Videos"};

Kind ChildKind(Kind parent) {
    switch (parent) {
        case Kind::kMonth:
        case Kind::kYear:
            return Kind::kEvent;
        case Kind::kEvent:
        case Kind::kEventPart:
            return Kind::kEventPart;
        case Kind::kScans:
            return Kind::kScans;
        default:
            return Kind::kProject;
    }
}

std::string FolderName(const Folder &f, Rng &rng) {
    char buffer[128];
    switch (f.kind) {
        case Kind::kEvent:
            snprintf(buffer, sizeof buffer, "%04d-%02d-%02d %s", f.year, f.month,
                     1 + static_cast<int>(rng.Below(28)), rng.Pick(kEvents));
            return buffer;
        case Kind::kEventPart:
            return rng.Pick(kEventParts);
        case Kind::kScans:
            snprintf(buffer, sizeof buffer, f.depth == 2 ? "Scans %04d" : "Batch %03d",
                     f.depth == 2 ? f.year : static_cast<int>(rng.Below(1000)));
            return buffer;
        default:
            switch (rng.Below(4)) {
                case 0:
                    snprintf(buffer, sizeof buffer, "Client %03d", static_cast<int>(rng.Below(400)));
                    return buffer;
                case 1:
                    snprintf(buffer, sizeof buffer, "Q%d %04d", 1 + static_cast<int>(rng.Below(4)), f.year);
                    return buffer;
                case 2:
                    snprintf(buffer, sizeof buffer, "Tax %04d", f.year);
                    return buffer;
                default:
                    return rng.Pick(kProjects);
            }
    }
}

std::string FileName(const Folder &f, Rng &rng) {
    char buffer[128];
    const int day = 1 + static_cast<int>(rng.Below(28));
    const int seconds = static_cast<int>(rng.Below(86400));
    const int hms = seconds / 3600 * 10000 + seconds / 60 % 60 * 100 + seconds % 60;
    const bool photos = f.kind == Kind::kMonth || f.kind == Kind::kEvent || f.kind == Kind::kEventPart ||
                        f.kind == Kind::kYear;
    const uint64_t style = rng.Below(10);
    if (photos && style < 6) {
        snprintf(buffer, sizeof buffer, "IMG_%04d%02d%02d_%06d.jpg", f.year, f.month, day, hms);
    } else if (photos && style < 8) {
        snprintf(buffer, sizeof buffer, "DSC%05d.JPG", static_cast<int>(rng.Below(100000)));
    } else if (photos && style < 9) {
        snprintf(buffer, sizeof buffer, "VID_%04d%02d%02d_%06d.mp4", f.year, f.month, day, hms);
    } else if (photos || f.kind == Kind::kScans || style < 3) {
        snprintf(buffer, sizeof buffer, "Scan %04d.%s", static_cast<int>(rng.Below(10000)),
                 rng.Below(2) == 0 ? "pdf" : "docx");
    } else {
        snprintf(buffer, sizeof buffer, "%s Q%d %04d%s", rng.Pick(kDocumentStems),
                 1 + static_cast<int>(rng.Below(4)), f.year, rng.Pick(kDocumentExtensions));
    }
    return buffer;
}

// A name not yet used in the folder: a clash gets " (2)", " (3)"... before the extension, as a
// desktop would name the copy.
std::string Unique(std::string name, std::unordered_set<std::string> *used) {
    if (used->insert(name).second) {
        return name;
    }
    const size_t dot = name.rfind('.');
    const size_t cut = dot == std::string::npos || dot == 0 ? name.size() : dot;
    for (int n = 2;; ++n) {
        std::string candidate = name.substr(0, cut) + " (" + std::to_string(n) + ")" + name.substr(cut);
        if (used->insert(candidate).second) {
            return candidate;
        }
    }
}

class Maker {
public:
    Maker(std::vector<Folder> *folders, Rng *rng) : folders_(*folders), rng_(*rng) {}

    // Creates folder index's contents in the directory open at fd, then its sub-folders.
    void Fill(int fd, int index) {
        std::unordered_set<std::string> used;
        Folder &f = folders_[index];
        for (int child : f.children) {
            Folder &c = folders_[child];
            if (c.name.empty()) {
                c.name = FolderName(c, rng_);
            }
            c.name = Unique(c.name, &used);
        }
        std::vector<std::string> files;
        for (int i = 0; i < f.files; ++i) {
            files.push_back(Unique(FileName(f, rng_), &used));
            const int file = openat(fd, files.back().c_str(), O_CREAT | O_EXCL | O_WRONLY | O_CLOEXEC, 0644);
            if (file < 0) {
                Die("create", files.back());
            }
            close(file);
        }
        // Links as users make them: to a sibling folder or file, and now and then one that loops.
        for (int i = 0; i < f.links; ++i) {
            std::string target = "..";
            if (!f.children.empty() && i % 3 == 0) {
                target = folders_[f.children[rng_.Below(f.children.size())]].name;
            } else if (!files.empty() && i % 3 == 1) {
                target = files[rng_.Below(files.size())];
            }
            const std::string name = Unique(target == ".." ? "Up" : "Shortcut to " + target, &used);
            if (symlinkat(target.c_str(), fd, name.c_str()) != 0) {
                Die("link", name);
            }
        }
        if (f.hidden && !files.empty()) {
            MakeHidden(fd, files);
        }
        for (int child : f.children) {
            const std::string &name = folders_[child].name;
            if (mkdirat(fd, name.c_str(), 0755) != 0) {
                Die("mkdir", name);
            }
            const int childFd = openat(fd, name.c_str(), O_RDONLY | O_DIRECTORY | O_NOFOLLOW | O_CLOEXEC);
            if (childFd < 0) {
                Die("open", name);
            }
            Fill(childFd, child);
            close(childFd);
        }
    }

private:
    // "@eaDir" with a folder of thumbnails per picture, as the appliance's indexer leaves them.
    void MakeHidden(int fd, const std::vector<std::string> &files) {
        if (mkdirat(fd, "@eaDir", 0755) != 0) {
            Die("mkdir", "@eaDir");
        }
        const int hidden = openat(fd, "@eaDir", O_RDONLY | O_DIRECTORY | O_NOFOLLOW | O_CLOEXEC);
        if (hidden < 0) {
            Die("open", "@eaDir");
        }
        for (size_t i = 0; i < files.size() && i < 3; ++i) {
            if (mkdirat(hidden, files[i].c_str(), 0755) != 0) {
                Die("mkdir", files[i]);
            }
            const int thumbs =
                openat(hidden, files[i].c_str(), O_RDONLY | O_DIRECTORY | O_NOFOLLOW | O_CLOEXEC);
            for (const char *name : {"thumb_small.jpg", "thumb_large.jpg"}) {
                const int file = thumbs < 0 ? -1 : openat(thumbs, name, O_CREAT | O_WRONLY | O_CLOEXEC, 0644);
                if (file < 0) {
                    Die("create", name);
                }
                close(file);
            }
            close(thumbs);
        }
        close(hidden);
    }

    std::vector<Folder> &folders_;
    Rng &rng_;
};

}  // namespace

int main(int argc, char **argv) {
    if (argc < 2 || argc > 4) {
        fprintf(stderr, "usage: walk_tree DIR [ENTRIES [SEED]]\n");
        return 2;
    }
    const long entries = argc > 2 ? strtol(argv[2], nullptr, 10) : 1000000;
    Rng rng(argc > 3 ? strtoull(argv[3], nullptr, 10) : 20190412);
    if (entries < 1000) {
        fprintf(stderr, "walk_tree: ENTRIES must be at least 1000\n");
        return 2;
    }

    // The skeleton: Photos/<year>/<month>, and the other top-level folders.
    std::vector<Folder> folders;
    auto add = [&folders](int parent, Kind kind, int year, int month, std::string name) {
        const int depth = parent < 0 ? 0 : folders[parent].depth + 1;
        folders.push_back(Folder{parent, depth, kind, year, month, std::move(name), {}});
        if (parent >= 0) {
            folders[parent].children.push_back(static_cast<int>(folders.size()) - 1);
        }
        return static_cast<int>(folders.size()) - 1;
    };
    add(-1, Kind::kRoot, kFirstYear + kYears - 1, 1, "");
    const int photos = add(0, Kind::kPhotos, kFirstYear + kYears - 1, 1, "Photos");
    for (int y = 0; y < kYears; ++y) {
        const int year = add(photos, Kind::kYear, kFirstYear + y, 1, std::to_string(kFirstYear + y));
        for (int m = 1; m <= 12; ++m) {
            char name[8];
            snprintf(name, sizeof name, "%02d", m);
            add(year, Kind::kMonth, kFirstYear + y, m, name);
        }
    }
    for (const char *name : kTopLevel) {
        add(0, strcmp(name, "Scans") == 0 ? Kind::kScans : Kind::kDocuments, kFirstYear + kYears - 1, 1,
            name);
    }

    // The rest of the folders: a depth drawn from what real shares show (most at 4 to 7), under
    // a folder one level up drawn at random; the photo years take no new children of their own.
    const long wantFolders = std::max<long>(entries * 6 / 100, static_cast<long>(folders.size()) + kMaxDepth);
    const double depthWeights[kMaxDepth + 1] = {0, 0, 3, 8, 16, 20, 18, 13, 9, 6, 4, 2};
    std::vector<std::vector<int>> parentsAt(kMaxDepth + 1);
    for (size_t i = 1; i < folders.size(); ++i) {
        if (folders[i].kind != Kind::kPhotos && folders[i].kind != Kind::kYear) {
            parentsAt[folders[i].depth].push_back(static_cast<int>(i));
        }
    }
    auto grow = [&](int parent) {
        const Folder &p = folders[parent];
        const bool dated = p.kind == Kind::kDocuments || p.kind == Kind::kScans;
        const int year = dated ? kFirstYear + static_cast<int>(rng.Below(kYears)) : p.year;
        const int child = add(parent, ChildKind(p.kind), year, p.month, "");
        if (folders[child].depth < kMaxDepth) {
            parentsAt[folders[child].depth].push_back(child);
        }
    };
    // One chain down to the deepest level first, so every depth has somewhere to grow.
    for (int at = parentsAt[1].back(); folders[at].depth < kMaxDepth;
         at = static_cast<int>(folders.size()) - 1) {
        grow(at);
    }
    double depthTotal = 0;
    for (double w : depthWeights) {
        depthTotal += w;
    }
    while (static_cast<long>(folders.size()) - 1 < wantFolders) {
        double draw = rng.Unit() * depthTotal;
        int depth = 2;
        while (depth < kMaxDepth && draw > depthWeights[depth]) {
            draw -= depthWeights[depth++];
        }
        const std::vector<int> &parents = parentsAt[depth - 1];
        grow(parents[rng.Below(parents.size())]);
    }

    // Files: each folder draws a heavy-tailed weight; every file goes to a folder drawn by weight.
    std::vector<double> cumulative(folders.size());
    double total = 0;
    for (size_t i = 0; i < folders.size(); ++i) {
        const double w = std::min(std::pow(rng.Unit(), -1.1), 2000.0);
        total += i == 0 || folders[i].kind == Kind::kPhotos || folders[i].kind == Kind::kYear ? 0.0 : w;
        cumulative[i] = total;
    }
    const long folderCount = static_cast<long>(folders.size()) - 1;
    const long links = std::max<long>(entries / 20000, 3);
    const long fileCount = entries - folderCount - links;
    for (long i = 0; i < fileCount; ++i) {
        const double draw = rng.Unit() * total;
        const size_t at = std::lower_bound(cumulative.begin(), cumulative.end(), draw) - cumulative.begin();
        ++folders[std::min(at, folders.size() - 1)].files;
    }
    for (long i = 0; i < links; ++i) {
        ++folders[1 + rng.Below(folders.size() - 1)].links;
    }
    long hidden = 0;
    for (Folder &f : folders) {
        if ((f.kind == Kind::kEvent || f.kind == Kind::kMonth) && f.files > 0 && rng.Below(100) == 0) {
            f.hidden = true;
            ++hidden;
        }
    }

    if (mkdir(argv[1], 0755) != 0) {
        Die("mkdir", argv[1]);
    }
    const int root = open(argv[1], O_RDONLY | O_DIRECTORY | O_NOFOLLOW | O_CLOEXEC);
    if (root < 0) {
        Die("open", argv[1]);
    }
    Maker(&folders, &rng).Fill(root, 0);
    close(root);
    int deepest = 0;
    for (const Folder &f : folders) {
        deepest = std::max(deepest, f.depth);
    }
    printf("walk_tree: %ld entries: %ld folders, %ld files, %ld links; %ld hidden folders; %d levels\n",
           folderCount + fileCount + links, folderCount, fileCount, links, hidden, deepest + 1);
    return 0;
}
