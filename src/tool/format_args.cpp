// See format_args.h.
#include "tool/format_args.h"

#include <fmt/format.h>

#include <ctime>
#include <random>

#include "hfs/names_text.h"
#include "tool/errors.h"
#include "tool/options.h"

namespace VELK::tool {

namespace {

constexpr s64 kMacEpoch = 2082844800;  // seconds from 1904 to 1970
constexpr std::size_t kLongestName = 255;

u32 ReadNodeSize(const std::string& text) {
    u64 size = 0;
    if (!ParseSize(text, &size)) {
        ThrowUsage("", fmt::format("--node-size: '{}' is no size in bytes", text),
                   "for example 4096 or c=8192,e=4096,a=8192");
    }
    NodeShiftOf(size);
    return static_cast<u32>(size);
}

}  // namespace

void ReadNodeSizes(const std::string& text, FormatOptions* options) {
    std::string seen;  // trees that have been given a size
    std::size_t at = 0;
    while (at < text.size()) {
        const std::size_t end = std::min(text.find(',', at), text.size());
        const std::string item = text.substr(at, end - at);
        at = end + 1;
        const bool isForOne = item.size() >= 2 && item[1] == '=';
        if (seen.find(isForOne ? item[0] : '*') != std::string::npos) {
            ThrowUsage("", fmt::format("--node-size: '{}' gives a tree a second size", item),
                       "give each tree one");
        }
        seen += isForOne ? item[0] : '*';
        if (!isForOne) {
            const u32 size = ReadNodeSize(item);
            options->catalogNodeSize = size;
            options->extentsNodeSize = size;
            options->attributesNodeSize = size;
            continue;
        }
        const u32 size = ReadNodeSize(item.substr(2));
        switch (item[0]) {
            case 'c':
                options->catalogNodeSize = size;
                break;
            case 'e':
                options->extentsNodeSize = size;
                break;
            case 'a':
                options->attributesNodeSize = size;
                break;
            default:
                ThrowUsage("", fmt::format("--node-size: '{}' names no tree", item),
                           "c, e and a stand for catalog, extents and attributes");
        }
    }
}

u32 NodeShiftOf(u64 nodeSize) {
    for (u32 shift = kMinNodeShift; shift <= kMaxNodeShift; ++shift) {
        if (nodeSize == u64{1} << shift) {
            return shift;
        }
    }
    ThrowUsage("", fmt::format("node size {} is none", Grouped(nodeSize)),
               "powers of two from 512 to 32768 are");
}

u32 ReadDate(const std::string& text) {
    std::tm fields{};
    const char* rest = strptime(text.c_str(), "%Y-%m-%d", &fields);
    if (rest != nullptr && (*rest == 'T' || *rest == ' ')) {
        rest = strptime(rest + 1, "%H:%M:%S", &fields);
    }
    const s64 seconds = timegm(&fields) + kMacEpoch;
    const bool ended = rest != nullptr && (*rest == 0 || (*rest == 'Z' && rest[1] == 0));
    if (!ended || seconds < 0 || seconds > 0xFFFFFFFF) {
        ThrowUsage("", fmt::format("date '{}' is none the volume can hold", text),
                   "for example 2026-11-21T01:18:16Z, from 1904 to 2040");
    }
    return static_cast<u32>(seconds);
}

u32 HfsNow() {
    return static_cast<u32>(std::time(nullptr) + kMacEpoch);
}

u64 ReadUuid(const std::string& text) {
    std::size_t used = 0;
    if (text.empty() || text.size() > 16 ||
        text.find_first_not_of("0123456789abcdefABCDEF") != std::string::npos) {
        ThrowUsage("", fmt::format("--uuid '{}' is no identifier", text),
                   "give up to 16 hexadecimal digits");
    }
    return std::stoull(text, &used, 16);
}

u64 RandomUuid() {
    std::random_device device;
    return (u64{device()} << 32) | device();
}

std::u16string StoredName(const std::string& text) {
    std::u16string typed;
    if (!UnitsFromUtf8(text, &typed)) {
        ThrowUsage("", "a name is not UTF-8", "");
    }
    const std::u16string name = DecomposedUnits(typed);
    if (name.empty() || name.size() > kLongestName) {
        ThrowUsage("", fmt::format("a name of {} UTF-16 units cannot be stored", name.size()),
                   "1 to 255 can");
    }
    return name;
}

std::string BinarySize(u64 bytes) {
    for (const auto& [unit, name] :
         {std::pair<u64, const char*>{1u << 30, "GiB"}, {1u << 20, "MiB"}, {1u << 10, "KiB"}}) {
        if (bytes >= unit && bytes % unit == 0) {
            return fmt::format("{} {}", Grouped(bytes / unit), name);
        }
    }
    return fmt::format("{} B", Grouped(bytes));
}

}  // namespace VELK::tool
