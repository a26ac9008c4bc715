// Between composed and decomposed names. HFS+ stores every name decomposed (canonical
// decomposition of Unicode 3.2 with some ranges left alone, marks in canonical order), while people
// type, and most systems show, composed ones. Units are in host order. Works on single UTF-16
// units: the format decomposes no supplementary character, so surrogates, lone ones included, pass
// through unchanged.
#pragma once

#include "platform/types.h"

namespace VELK {

// A unit decomposes into no more than this many.
constexpr unsigned kMaxUnitDecomposition = 4;

// Writes the stored form of a name. False, with `target` partly filled, if it does not fit into
// `capacity` units; kMaxUnitDecomposition * count always suffice. The areas must not overlap.
bool DecomposeName(const u16* source, unsigned count, u16* target, unsigned capacity,
                   unsigned* targetCount);

// Composes `units` in place, for display; returns the new count, never above `count`.
unsigned ComposeName(u16* units, unsigned count);

}  // namespace VELK
