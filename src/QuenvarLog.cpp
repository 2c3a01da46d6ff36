#include "QuenvarLog.h"

const KalbLogClient quenvarLog("Quenvar");
