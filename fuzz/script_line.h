// Lines of the script language, mostly well formed: what bytes drawn at random hardly ever are.
#pragma once

#include <string>

#include "mutate.h"

namespace VELK::fuzz {

// A word of a record as text: the start of one, or of one of its fields.
std::string RecordWord(Mutator* mutator);
// One line with its end: an operation with arguments of the right shapes and telling values.
std::string ScriptLineText(Mutator* mutator);

}  // namespace VELK::fuzz
