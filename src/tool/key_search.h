// find --key and find --nearest: one lookup, and the way it took.
#pragma once

#include <string>

#include "tool/session.h"

namespace VELK::tool {

struct KeySearch {
    std::string text;
    bool nearest = false;    // an absent key is an answer, too
    bool tracePath = false;  // show every level
};

// Returns the exit code.
int SearchByKey(Session* session, Invocation* call, const KeySearch& search);

}  // namespace VELK::tool
