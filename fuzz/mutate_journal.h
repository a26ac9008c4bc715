// Mutations that know a journal: its header, its block lists, the sectors these carry; and the
// checksums, without which nearly everything would be refused at once.
#pragma once

#include "mutate.h"

namespace VELK::fuzz {

// Which checksums are made to fit, and the order of bytes in which the journal is read.
constexpr u8 kFitHeader = 1;
constexpr u8 kFitLists = 2;
constexpr u8 kLittleEndian = 4;

// Both: REQUIRES: two sectors or more.
// Makes the checksums fit as `how` says: the header's, and those of the lists a reader would meet.
void FitChecksums(u8* journal, u64 size, u8 how);

// Changes a field of the header, of a list, or of what a list carries to its place.
void MutateJournal(Mutator* mutator, u8* journal, u64 size, bool isLittle);

}  // namespace VELK::fuzz
