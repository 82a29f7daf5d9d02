// A whole search as a request runs it: NvoSearchWalker over a folder, by walking (no index on
// the volume), a name condition, the hits stored in the task's database.
//   search_walk USER FOLDER TERMS      as USER (already the process's identity): prints the hits
//   search_walk --prepare USER VOLUME  as root, once: USER's task folders on VOLUME
#include <stdio.h>
#include <string.h>

#include <string>
#include <vector>

#include "norvo/searchdb.h"
#include "norvo/searchwalker.h"

int main(int argc, char **argv) {
    if (argc == 4 && strcmp(argv[1], "--prepare") == 0) {
        NvoSearchDBTask task(argv[3], argv[2], nullptr);
        return task.getDBTaskFilePath().empty() ? 1 : 0;
    }
    if (argc != 4) {
        fprintf(stderr, "usage: search_walk USER FOLDER TERMS | --prepare USER VOLUME\n");
        return 2;
    }
    std::vector<FileSearch::FindComp *> conds;
    if (!FileSearch::FindFactory::createFindOp(FileSearch::FindFactory::FIND_FIELD_NAME, nullptr, argv[3],
                                               conds)) {
        return 1;
    }
    unsigned long long hits = 0;
    bool ok = false;
    {
        FileSearch::NvoSearchWalker walker(argv[1], "bench", nullptr);
        ok = walker.init({argv[2]}, conds) && walker.Walk({});
        const FI_QUERY all{};
        ok = ok && FILEIDXCountGet(walker.getDBPath().c_str(), &all, &hits) == 0;
        NvoSearchDBTask(walker.getDBVol().c_str(), argv[1], walker.getDBTaskId().c_str()).remove();
    }
    for (FileSearch::FindComp *cond : conds) {
        delete cond;
    }
    if (!ok) {
        fprintf(stderr, "search_walk: the search failed\n");
        return 1;
    }
    printf("%llu\n", hits);
    return 0;
}
