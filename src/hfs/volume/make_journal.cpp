// A journal in a volume that was just made. The two files that account for its blocks are ordinary
// files in the root folder, each of one extent, invisible and not to be moved.
#include "hfs/volume/make_journal.h"

#include "hfs/volume/journal_state.h"
#include "hfs/volume/wire.h"

namespace VELK {

namespace {

constexpr u32 kFileRecordSize = 248;
constexpr u32 kThreadFixed = 10;
constexpr u32 kDataFork = 88;
constexpr u32 kForkSize = 80;
constexpr u16 kThreadExists = 2;
constexpr u16 kFileMode = 0100000;
constexpr u16 kInvisible = 0x4000 | 0x1000;  // and its name locked
constexpr u32 kTypeCode = 0x6A726E6C;        // "jrnl"
constexpr u32 kCreatorCode = 0x6866732B;     // "hfs+"

struct NewFile {
    const char16_t* name;
    u32 id;
    HfsExtent extent;
    u64 size;
};

std::vector<u8> FileRecord(const NewFile& file, u32 date) {
    std::vector<u8> record(kFileRecordSize);
    StoreBe16(record.data(), 2);  // file
    StoreBe16(record.data() + 2, kThreadExists);
    StoreBe32(record.data() + 8, file.id);
    for (const u32 dateAt : {12u, 16u, 20u, 24u}) {
        StoreBe32(record.data() + dateAt, date);
    }
    StoreBe16(record.data() + 42, kFileMode);
    StoreBe32(record.data() + 44, 1);
    StoreBe32(record.data() + 48, kTypeCode);
    StoreBe32(record.data() + 52, kCreatorCode);
    StoreBe16(record.data() + 56, kInvisible);
    HfsFork fork{};
    fork.logicalSize = file.size;
    fork.totalBlocks = file.extent.blockCount;
    fork.extents[0] = file.extent;
    EncodeFork(fork, record.data() + kDataFork);
    EncodeFork(HfsFork{}, record.data() + kDataFork + kForkSize);
    return record;
}

std::vector<u8> ThreadRecord(const std::u16string& name) {
    std::vector<u8> record(kThreadFixed + 2 * name.size());
    StoreBe16(record.data(), 4);  // file thread
    StoreBe32(record.data() + 4, kRootFolderId);
    StoreBe16(record.data() + 8, static_cast<u32>(name.size()));
    for (std::size_t i = 0; i < name.size(); ++i) {
        StoreBe16(record.data() + kThreadFixed + 2 * i, name[i]);
    }
    return record;
}

}  // namespace

int InsertJournalFiles(
    const JournalBlocks& blocks, u32 blockSize, u32 date,
    const std::function<int(u32, const std::u16string&, const std::vector<u8>&)>& insert) {
    const u32 ring = blocks.count - 1;
    const NewFile files[kJournalFiles] = {
        {u".journal", kFirstUserId, {blocks.first + 1, ring}, u64{ring} * blockSize},
        {u".journal_info_block", kFirstUserId + 1, {blocks.first, 1}, blockSize},
    };
    int status = 0;
    for (const NewFile& file : files) {
        if (status == 0) {
            status = insert(kRootFolderId, file.name, FileRecord(file, date));
        }
        if (status == 0) {
            status = insert(file.id, u"", ThreadRecord(file.name));
        }
    }
    return status;
}

IoResult StartJournal(BlockDevice* device, const JournalBlocks& blocks, u32 blockSize) {
    JournalPlace place;
    place.infoOffset = u64{blocks.first} * blockSize;
    place.offset = place.infoOffset + blockSize;
    place.size = u64{blocks.count - 1} * blockSize;
    place.header.size = place.size;
    std::vector<u8> info(blockSize);
    EncodeJournalInfo({kJournalInVolume, place.offset, place.size}, info.data());
    IoResult result = device->Write(place.infoOffset, info.data(), info.size());
    if (result.Ok()) {
        result = device->Zero(place.offset, kJournalSector);
    }
    if (result.Ok()) {
        result = WriteJournalHeader(device, place);
    }
    return result.Ok() ? device->Sync() : result;
}

}  // namespace VELK
