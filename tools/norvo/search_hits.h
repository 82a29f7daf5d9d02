// The pages of a search task's hits, shared by search-db and search-results.
#pragma once
#include "command.h"

class NvoSearchDBTask;

namespace norvo::cli {

// Prints one page of task's hits as --offset, --limit, --sort, --desc, --type and --pattern
// ask (each optional) and returns the exit status.
int ListTaskHits(const Invocation &inv, const NvoSearchDBTask &task);

}  // namespace norvo::cli
