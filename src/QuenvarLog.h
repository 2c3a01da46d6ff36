#pragma once

#include "KalbLogClient.h"

// The plugin module's logging client, module "Quenvar": made when the module is loaded, so the
// library is loaded then and freed when the module is unloaded.
extern const KalbLogClient quenvarLog;
