// Order-keeping replacement, branch by branch.
#include "tool/name_mask.h"

#include <algorithm>

#include "hfs/names.h"
#include "hfs/treehfs/bytes.h"

namespace VELK::tool {

namespace {

// Units that are exchanged among each other. `first` to `last` are those a name may have, `from` to
// `to` those it gets as long as they suffice.
struct UnitClass {
    char16_t first, last;
    char16_t from, to;
};
constexpr UnitClass kClasses[] = {
    {0x0000, 0x002D, u'!', u'-'}, {u'.', u'.', u'.', u'.'},         {u'/', u'/', u'/', u'/'},
    {u'0', u'@', u'0', u'9'},     {u'A', u'Z', u'A', u'Z'},         {u'[', u'`', u'[', u'`'},
    {u'a', 0x007F, u'a', u'z'},   {0x0080, 0xFFFF, 0x4E00, 0x9FA5},
};
constexpr char16_t kFirstBeyondAscii = 0x0080;

u64 Mixed(u64 value) {
    value = (value ^ (value >> 31)) * 0x9E3779B97F4A7C15u;
    return value ^ (value >> 29);
}

}  // namespace

char16_t NameMask::OrderUnit(char16_t unit) const {
    return foldsCase_ ? static_cast<char16_t>(FoldHfsUnit(static_cast<u16>(unit))) : unit;
}

std::u16string NameMask::OrderOf(const u8* unitsBe, u32 count) const {
    std::u16string order;
    for (u32 i = 0; i < count; ++i) {
        const char16_t unit = OrderUnit(static_cast<char16_t>(GetBe16(unitsBe + 2 * i)));
        if (unit != 0 || !foldsCase_) {  // 0: the order does not see this unit
            order.push_back(unit);
        }
    }
    return order;
}

void NameMask::Add(u32 group, const u8* unitsBe, u32 count, bool keep) {
    names_.push_back({group, OrderOf(unitsBe, count), {}, keep});
}

u64 NameMask::Names() const {
    return static_cast<u64>(std::count_if(names_.begin(), names_.end(),
                                          [](const Name& name) { return !name.order.empty(); }));
}

bool NameMask::Prepare() {
    std::sort(names_.begin(), names_.end(), [](const Name& a, const Name& b) {
        return a.group != b.group   ? a.group < b.group
               : a.order != b.order ? a.order < b.order
                                    : a.keep > b.keep;
    });
    names_.erase(std::unique(names_.begin(), names_.end(),
                             [](const Name& a, const Name& b) {
                                 return a.group == b.group && a.order == b.order;
                             }),
                 names_.end());
    for (std::size_t begin = 0; begin < names_.size();) {
        std::size_t end = begin;
        while (end < names_.size() && names_[end].group == names_[begin].group) {
            ++end;
        }
        if (!Assign(begin, end, 0, true)) {
            return false;
        }
        begin = end;
    }
    return true;
}

// Gives the names [begin, end), which agree in their first `depth` units, the next unit and the
// ones behind it. `keeps`: those first units are unchanged.
bool NameMask::Assign(std::size_t begin, std::size_t end, std::size_t depth, bool keeps) {
    while (begin < end && names_[begin].order.size() == depth) {
        ++begin;  // the name that the others begin with
    }
    std::vector<Branch> branches;
    for (std::size_t i = begin; i < end; ++i) {
        const char16_t unit = names_[i].order[depth];
        if (branches.empty() || branches.back().unit != unit) {
            branches.push_back({unit, unit, false, i, i});
        }
        branches.back().end = i + 1;
        branches.back().isFixed = branches.back().isFixed || (keeps && names_[i].keep);
    }
    if (branches.empty()) {
        return true;
    }
    if (!Choose(&branches, Mixed(u64{names_[begin].group} << 16 | depth))) {
        return false;
    }
    for (const Branch& branch : branches) {
        for (std::size_t i = branch.begin; i < branch.end; ++i) {
            names_[i].other.push_back(branch.other);
        }
        if (!Assign(branch.begin, branch.end, depth + 1, branch.isFixed)) {
            return false;
        }
    }
    return true;
}

// Chooses the other units of the branches of one place. Those between two fixed ones stay between
// them; where in their class they begin depends on `seed`.
bool NameMask::Choose(std::vector<Branch>* branches, u64 seed) {
    std::size_t at = 0;
    for (const UnitClass& each : kClasses) {
        u32 lowest = each.first;
        while (at < branches->size() && (*branches)[at].unit <= each.last) {
            std::size_t end = at;
            while (end < branches->size() && (*branches)[end].unit <= each.last &&
                   !(*branches)[end].isFixed) {
                ++end;
            }
            const bool isFixed = end < branches->size() && (*branches)[end].unit <= each.last;
            const u32 highest = isFixed ? (*branches)[end].unit - 1u : each.last;
            const u64 count = end - at;
            u32 from = std::max<u32>(lowest, each.from);
            u32 to = std::min<u32>(highest, each.to);
            if (to + u64{1} < from + count) {  // the whole of the class
                from = lowest;
                to = highest;
                if (count != 0 && each.first == kFirstBeyondAscii) {
                    return false;  // anything beyond ASCII may have case, or no order
                }
            }
            if (count != 0) {
                from += static_cast<u32>(seed % (to - from + u64{2} - count));
            }
            for (; at < end; ++at) {
                (*branches)[at].other = static_cast<char16_t>(from++);
            }
            if (isFixed) {
                lowest = (*branches)[at].unit + 1u;
                ++at;
            }
        }
    }
    return true;
}

void NameMask::Replace(u32 group, u8* unitsBe, u32 count) const {
    const std::u16string order = OrderOf(unitsBe, count);
    const auto found = std::lower_bound(
        names_.begin(), names_.end(), order, [group](const Name& name, const std::u16string& text) {
            return name.group != group ? name.group < group : name.order < text;
        });
    if (found == names_.end() || found->group != group || found->order != order || found->keep) {
        return;
    }
    std::size_t at = 0;
    for (u32 i = 0; i < count; ++i) {
        const char16_t unit = static_cast<char16_t>(GetBe16(unitsBe + 2 * i));
        const char16_t seen = OrderUnit(unit);
        if (foldsCase_ && seen == 0) {
            continue;
        }
        const char16_t other = found->other[at++];
        const bool isCapital = seen != unit && other >= u'a' && other <= u'z';
        const char16_t written = other == seen ? unit
                                 : isCapital   ? static_cast<char16_t>(other - u'a' + u'A')
                                               : other;
        PutBe16(unitsBe + 2 * i, static_cast<u16>(written));
    }
}

}  // namespace VELK::tool
