#pragma once

#include "CamsimAuth.h"
#include "CamsimFault.h"

#include <string>

struct CamsimOptions {
    std::string host = "127.0.0.1";
    int port = 0;
    CamsimAuth::Scheme auth = CamsimAuth::Scheme::None;
    std::string user = "admin";
    std::string password = "admin";
    std::string tlsCert;
    std::string tlsKey;
    std::string logFile;
    CamsimFault fault;
};
