/// \file
/// The library's class interface, all of it: include this one header.
///
/// Every operation is a static function or a short-lived object that runs to completion on the
/// caller's thread; requests and results are JSON values. Failures return false and leave a code
/// in ErrorHandler (fileindex/error.h); nothing is thrown across the library boundary.
#ifndef FILEINDEX_FILEINDEX_H_
#define FILEINDEX_FILEINDEX_H_

#include "fileindex/config.h"
#include "fileindex/daemon.h"
#include "fileindex/eligibility.h"
#include "fileindex/error.h"
#include "fileindex/folder.h"
#include "fileindex/folders.h"
#include "fileindex/index_mgr.h"
#include "fileindex/queue.h"
#include "fileindex/root.h"
#include "fileindex/status.h"
#include "fileindex/status_mgr.h"
#include "fileindex/utils.h"

#endif  // FILEINDEX_FILEINDEX_H_
