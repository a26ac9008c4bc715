// The C interface: keys and records as text. Needs no volume.
#include "c/handles.h"
#include "hfs/records/record_json.h"
#include "hfs/records/record_text.h"

using namespace VELK;

int treehfs_key_parse(uint32_t tree, const char* text, void* key, uint32_t capacity,
                      uint32_t* size) {
    if (text == nullptr || size == nullptr || !IsTreeId(tree)) {
        return NoHandle();
    }
    return Guarded([&] {
        SearchKey parsed;
        const Problem problem = ParseKey(text, tree, &parsed);
        if (problem) {
            return FailC(kErrInvalid, problem.Text());
        }
        const std::vector<u8> stored = StoredKey(tree, parsed);
        return PutBytes(stored.data(), stored.size(), key, capacity, size);
    });
}

int treehfs_key_text(uint32_t tree, const void* key, uint32_t key_size, char* text,
                     uint32_t capacity, uint32_t* size) {
    if (key == nullptr || !IsTreeId(tree)) {
        return NoHandle();
    }
    return Guarded([&] {
        return PutText(KeyText(tree, static_cast<const u8*>(key), key_size, Blanks::kPlain), text,
                       capacity, size);
    });
}

int treehfs_data_parse(uint32_t tree, const char* text, void* data, uint32_t capacity,
                       uint32_t* size) {
    if (text == nullptr || size == nullptr || !IsTreeId(tree)) {
        return NoHandle();
    }
    return Guarded([&] {
        RecordData parsed;
        // A library does not read files that its caller did not open.
        const Problem problem = *text == '@' ? UsageProblem("a file is no data here", "")
                                             : ParseData(text, tree, &parsed);
        if (problem || parsed.isSame) {
            return FailC(kErrInvalid, problem ? problem.Text() : "'same' is no data here");
        }
        return PutBytes(parsed.stored.data(), parsed.stored.size(), data, capacity, size);
    });
}

int treehfs_record_json(uint32_t tree, const void* key, uint32_t key_size, const void* data,
                        uint32_t data_size, char* text, uint32_t capacity, uint32_t* size) {
    if (key == nullptr || (data == nullptr && data_size != 0) || !IsTreeId(tree)) {
        return NoHandle();
    }
    return Guarded([&] {
        std::string line;
        AppendRecordJson(tree, static_cast<const u8*>(key), key_size, static_cast<const u8*>(data),
                         data_size, RecordJsonOptions{}, &line);
        return PutText(line, text, capacity, size);
    });
}
