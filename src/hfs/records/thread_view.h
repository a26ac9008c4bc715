// Thread records of the catalog, read in place from the bytes of a leaf.
#pragma once

#include "hfs/records/record_fields.h"
#include "hfs/treehfs/bytes.h"

namespace VELK {

// The thread of a folder or file as stored; invalid for anything else, or when its name does not
// fit into the record.
class ThreadView {
public:
    // Of a record's data, which has to outlive the view.
    ThreadView(const u8* data, u32 size) : data_(data) {
        const u32 type = size >= kThreadFixed ? GetBe16(data) : 0;
        isValid_ = (type == kFolderThread || type == kFileThread) && Size() <= size;
    }

    // Fields may be asked of any thread that has them, the units of the name of a valid one.
    bool IsValid() const { return isValid_; }
    bool IsOfFolder() const { return GetBe16(data_) == kFolderThread; }
    // The folder that its item lies in.
    u32 Parent() const { return GetBe32(data_ + 4); }
    // The item's name there: big-endian units.
    u32 NameLength() const { return GetBe16(data_ + 8); }
    const u8* Name() const { return data_ + kThreadFixed; }
    // Bytes up to the end of the name; the record may be longer.
    u32 Size() const { return kThreadFixed + 2 * NameLength(); }

private:
    const u8* data_;
    bool isValid_;
};

}  // namespace VELK
