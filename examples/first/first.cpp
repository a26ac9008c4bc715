// Lists the root folder of an image, attaches a note to the folder, and writes that to the image.
#include <cstdio>

#include "hfs/records/record_text.h"
#include "hfs/records/stored_records.h"

using namespace VELK;

int main(int argc, char** argv) {
    OpenOptions options;
    options.access = Access::kWrite;
    Problem problem;
    auto volume =
        ImageVolume::OpenFile(argc > 1 ? argv[1] : "disk.img", options, nullptr, &problem);
    if (!volume) {
        std::fprintf(stderr, "%s\n", problem.Text().c_str());
        return 1;
    }
    SearchKey key;
    ParseKey("2:\"\"", kCatalogFileId, &key);  // 2 is the root folder
    RecordCursor cursor(volume.get(), kCatalogFileId);
    cursor.Seek(key);
    StoredRecord record;
    cursor.Next(&record);  // the folder's own thread comes first
    while (cursor.Next(&record) == kOk && record.id == 2) {
        std::printf("%s\n", KeyText(kCatalogFileId, record).c_str());
    }
    cursor.Release();  // before anything changes
    RecordData note;
    ParseKey("2:note", kAttributesFileId, &key);
    ParseData("inline{\"seen\"}", kAttributesFileId, &note);
    int status = InsertStored(volume.get(), kAttributesFileId, key, note.stored);
    status = status == kOk ? volume->Commit(0) : status;
    std::printf("note: %s\n", StatusText(status));
    return status == kOk ? 0 : 1;
}
