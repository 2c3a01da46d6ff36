#pragma once

#include "KalbLogClient.h"

// The host's logging client, module "QuenvarHost": failures at level 2 (shown by default, on
// standard error or in KALBLOG_FILE), traces at level 5 (--verbose). Made on first use, after
// main has set KALBLOG_LEVEL.
const KalbLogClient& hostLog();
