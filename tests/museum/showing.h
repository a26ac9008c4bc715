// Shows an exhibit to the engine, the checker and the program, and collects what they say.
#pragma once

#include <string>

#include "exhibit.h"

namespace VELK::test {

// What was said, in the form in which an Exhibit states it.
struct Shown {
    std::string engine;
    std::string check;
    std::string exits;
    std::string refusal;
    // What must never be: the image changed by reading or by a refused change, a failure without a
    // word or with an unreadable one, an exit code that no command ends with. Empty: nothing.
    std::string fault;
};

Shown Show(const Exhibit& exhibit);

}  // namespace VELK::test
