// How much a comparison has to look at.
#pragma once

#include <cstdint>
#include <string>

#include "fileindex/index_scope.h"
#include "operation_handler.h"

namespace quarrox::fileindexd {

// The files and directories of the tree at a directory that a comparison looks at, itself included. Only names are
// read, which costs little beside looking at each; so the count may differ a little from what a comparison meets.
uint64_t CountTree(const fileindex::IndexScope& scope, const std::string& directory,
                   const OperationHandler::CheckPoint& check_point);

}  // namespace quarrox::fileindexd
