#pragma once

#include "KalbLogClient.h"

// Wendrel's logging client, module "Wendrel", made on first use. Never log credentials.
const KalbLogClient& wendrelLog();
