// Replaces names by others of the same length and in the same order, so that a tree keeps its shape
// to the byte while nothing can be learnt from it.
//
// The names of one folder are looked at as a tree of their code units, as the volume compares them.
// At each branch the units that occur are given others, in the same order: letters letters, digits
// digits, everything beyond ASCII ideographs, which have no case. A full stop stays one.
#pragma once

#include <string>
#include <vector>

#include "platform/types.h"

namespace VELK::tool {

class NameMask {
public:
    // `foldsCase`: names are ordered without regard to case.
    explicit NameMask(bool foldsCase) : foldsCase_(foldsCase) {}

    // Names of one group (a folder's, or a file's attributes) keep their order among each other.
    // `keep`: this name stays as it is. Units are big-endian, as stored.
    void Add(u32 group, const u8* unitsBe, u32 count, bool keep);
    // After the last Add. False: a folder has more different characters than there are others.
    bool Prepare();
    // Writes the other name over one that was added.
    void Replace(u32 group, u8* unitsBe, u32 count) const;
    // How many names were added, the empty ones of thread records left out.
    u64 Names() const;

private:
    struct Name {
        u32 group;
        std::u16string order;  // what the volume compares
        std::u16string other;  // the same number of units
        bool keep;
    };
    struct Branch {
        char16_t unit;
        char16_t other;
        bool isFixed;
        std::size_t begin;
        std::size_t end;
    };

    char16_t OrderUnit(char16_t unit) const;
    std::u16string OrderOf(const u8* unitsBe, u32 count) const;
    bool Assign(std::size_t begin, std::size_t end, std::size_t depth, bool keeps);
    static bool Choose(std::vector<Branch>* branches, u64 seed);

    bool foldsCase_;
    std::vector<Name> names_;
};

}  // namespace VELK::tool
