// Order of HFS+ names. The first name is in host order (a search key's), the second big-endian as
// stored; neither needs to be aligned, and lengths count UTF-16 code units. Positive: the first
// name sorts after the second. Both orders are total and never change: the order of every existing
// volume depends on them.
#pragma once

#include "platform/types.h"

namespace VELK {

// Folds case unit by unit and skips ignorable units; names that differ only in these are equal.
int CompareHfsNamesIns(const void* first, unsigned firstLength, const void* second,
                       unsigned secondLength);

// Compares code units as unsigned 16-bit numbers; a proper prefix is smaller.
int CompareHfsNamesBin(const void* first, unsigned firstLength, const void* second,
                       unsigned secondLength);

// The folded value of one code unit; 0: the unit is ignorable.
u16 FoldHfsUnit(u16 unit);

}  // namespace VELK
