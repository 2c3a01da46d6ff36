#include "CamsimFault.h"

namespace {

struct ModeName {
    CamsimFault::Mode mode;
    const char* name;
};

const ModeName MODE_NAMES[] = {
    {CamsimFault::Mode::None, "none"},         {CamsimFault::Mode::Status, "status"},
    {CamsimFault::Mode::Delay, "delay"},       {CamsimFault::Mode::Close, "close"},
    {CamsimFault::Mode::Oversize, "oversize"},
};

} // namespace

bool CamsimFault::parseMode(const std::string& text, Mode* mode) {
    for (const ModeName& entry : MODE_NAMES) {
        if (text == entry.name) {
            *mode = entry.mode;
            return true;
        }
    }
    return false;
}

const char* CamsimFault::modeName(Mode mode) {
    for (const ModeName& entry : MODE_NAMES) {
        if (entry.mode == mode)
            return entry.name;
    }
    return "none";
}
