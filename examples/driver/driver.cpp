// The engine with nothing beneath it: no C library, no C++ run-time library, only what a driver
// supplies. Makes a tree on the volume in memory, fills it, opens it again and looks records up;
// the program's exit status says at which step it failed, 0 at none.
#include "../ram_volume/ram_volume.h"
#include "hfs/treehfs.h"
#include "hfs/volume/convert.h"
#include "platform/heap.h"
#include "platform/trace.h"

using namespace VELK;

// --- what the engine asks of a platform --------------------------------------------------------

unsigned velk_trace_level = 0;

namespace {

alignas(16) u8 arena[8u << 20];
std::size_t arenaUsed = 0;

}  // namespace

extern "C" {

// Memory is handed out from the front and never taken back: enough for a demonstration.
void* velk_heap_alloc(std::size_t size) {
    const std::size_t start = arenaUsed;
    arenaUsed += (size + 15) / 16 * 16;
    return arenaUsed <= sizeof arena ? arena + start : nullptr;
}
void velk_heap_free(void*) {}
void VELKError(unsigned, const char*, int) {}
void _VELKTrace(const char*, ...) {}
void velk_printk(void*, const char*, ...) {}
void VELK_DumpMemory(const void*, unsigned) {}

// --- what the compiler asks of any program -----------------------------------------------------

void* memcpy(void* target, const void* source, std::size_t size) {
    u8* to = static_cast<u8*>(target);
    const u8* from = static_cast<const u8*>(source);
    for (std::size_t i = 0; i < size; ++i) {
        to[i] = from[i];
        asm volatile("");  // or the compiler would call memcpy for this very loop
    }
    return target;
}
void* memmove(void* target, const void* source, std::size_t size) {
    u8* to = static_cast<u8*>(target);
    const u8* from = static_cast<const u8*>(source);
    if (to <= from) {
        return memcpy(target, source, size);
    }
    for (std::size_t i = size; i-- > 0;) {
        to[i] = from[i];
        asm volatile("");
    }
    return target;
}
void* memset(void* target, int value, std::size_t size) {
    u8* to = static_cast<u8*>(target);
    for (std::size_t i = 0; i < size; ++i) {
        to[i] = static_cast<u8>(value);
        asm volatile("");
    }
    return target;
}
int memcmp(const void* first, const void* second, std::size_t size) {
    const u8* a = static_cast<const u8*>(first);
    const u8* b = static_cast<const u8*>(second);
    for (std::size_t i = 0; i < size; ++i) {
        if (a[i] != b[i]) {
            return a[i] < b[i] ? -1 : 1;
        }
    }
    return 0;
}

[[noreturn]] void _start();
}

namespace {

constexpr u32 kRecords = 500;

// The key of an attribute without a name, in host order.
struct alignas(4) AttributeKey {
    u16 keyLength;
    u16 pad;
    u32 fileId;
    u32 startBlock;
    u16 nameLength;
};

union Attribute {
    struct {
        u32 type;  // 0x10: the value follows
        u32 reserved[2];
        u32 size;
        u32 value;
    } inlined;
    u8 room[4096];  // a caller cannot know what lies in a tree
};
constexpr unsigned kAttributeSize = 20;

int Run() {
    RamVolume volume;
    static Attribute record;
    for (int round = 0; round < 2; ++round) {
        CBTreeHfs tree;
        tree.volume = &volume.fs;
        tree.fileId = kAttributesFileId;
        tree.convert = ConvertFor(kAttributesFileId);
        if ((round == 0 ? tree.Create(11, 0, nullptr) : tree.Init()) != kOk) {
            return 1 + round;
        }
        for (u32 i = 0; i < kRecords; ++i) {
            const u32 fileId = 16 + i * 7 % kRecords;  // every one of them, in no order
            const AttributeKey key = {kAttrKeyFixed, 0, fileId, 0, 0};
            unsigned size = kAttributeSize;
            record.inlined = {0x10, {}, 4, round == 0 ? fileId : 0};
            const int status =
                round == 0 ? tree.InsertRecord(&key, fileId, &record, size)
                           : tree.FindRecord(&key, fileId, &record, sizeof record, &size, nullptr);
            if (status != kOk || size != kAttributeSize || record.inlined.value != fileId) {
                return 3 + round;
            }
        }
        if (tree.Flush(0) != kOk || tree.header.leafRecords != kRecords) {
            return 5 + round;
        }
        tree.Dtor();
    }
    return volume.lentBlocks == 0 ? 0 : 7;
}

[[noreturn]] void Exit(int status) {
#if defined(__x86_64__)
    asm volatile("syscall" : : "a"(60), "D"(status));
#elif defined(__aarch64__)
    register long number asm("x8") = 93;
    register long first asm("x0") = status;
    asm volatile("svc 0" : : "r"(number), "r"(first));
#endif
    for (;;) {
    }
}

}  // namespace

#if defined(__x86_64__)
__attribute__((force_align_arg_pointer))
#endif
void _start() {
    Exit(Run());
}
