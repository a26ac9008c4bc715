// Keys as they lie in nodes: whether one can be trusted, which of two comes first, and how one is
// written for a person.
#pragma once

#include <string>

#include "hfs/check/check.h"
#include "hfs/format.h"

namespace VELK {

// The longest key with its length field, and a byte of padding.
constexpr u32 kCheckKeyRoom = kKeyLengthSize + kMaxKeyLength + 2;

struct CheckKeyKind {
    u32 fileId = 0;
    CheckNameOrder names = CheckNameOrder::kFolding;

    CheckId RangeId() const { return fileId == kExtentsFileId ? CheckId::K05 : CheckId::K01; }
};

struct CheckKeyFault {
    CheckSeverity severity = CheckSeverity::kError;
    std::string text;  // empty: no fault
};

// Looks at the key that starts at `key` with `room` bytes up to the end of its record. `fault` is
// only touched when there is one; true: the key can be compared and shown all the same.
bool CheckKeySound(const CheckKeyKind& kind, const u8* key, u32 room, CheckKeyFault* fault);

// Negative, 0 or positive, as the tree orders them. REQUIRES: both sound.
int CompareCheckKeys(const CheckKeyKind& kind, const u8* left, const u8* right);

// The same bytes, which spares the comparison of what folds to the same.
bool SameCheckKeys(const u8* left, const u8* right);

// `2:"alpha"`, `5:data:0`, `37:"tag"`, `37:"big":8`. REQUIRES: sound.
std::string CheckKeyText(const CheckKeyKind& kind, const u8* key);

// Big-endian code units between double quotes, what cannot be shown as \uXXXX.
std::string CheckNameText(const u8* units, u32 count);

}  // namespace VELK
