// See demo_volume.h.
#include "tool/demo_volume.h"

#include <fmt/format.h>

#include <array>
#include <cstring>
#include <vector>

#include "hfs/records/key_text.h"
#include "hfs/records/record_text.h"
#include "hfs/volume/convert.h"
#include "hfs/volume/make_volume.h"
#include "tool/errors.h"

namespace VELK::tool {

namespace {

constexpr u64 kVolumeBytes = u64{64} << 20;
constexpr u32 kFolders = 200;
constexpr u32 kFilesPerFolder = 100;
constexpr u32 kRoot = 2;
constexpr u32 kFirstId = 16;
constexpr u32 kValenceAt = 4;      // number of items, in a folder record
constexpr u32 kDate = 3876076800;  // 2026-10-29, in seconds since 1904

constexpr std::array<const char*, 12> kWords = {"Atlas",  "Ballad",  "Cedar",  "Delta",
                                                "Ember",  "Fjord",   "Garden", "Harbour",
                                                "Island", "Juniper", "Kettle", "Lantern"};

class DemoMaker {
public:
    DemoMaker(ImageVolume* volume, DemoFigures* figures)
        : volume_(volume), tree_(volume->Tree(kCatalogFileId, nullptr)), figures_(figures) {}

    void Fill() {
        for (u32 folder = 0; folder < kFolders; ++folder) {
            const u32 id = nextId_++;
            folderIds_.push_back(id);
            Insert(
                kRoot, FolderName(folder),
                fmt::format("folder{{id:{},valence:{},mode:040755,created:2026-10-29T00:00:00Z}}",
                            id, kFilesPerFolder),
                id, 1);
        }
        SetValence(1, "Demo", kFolders);
        // The files come folder by folder in turn, as many writers at once would bring them.
        for (u32 file = 0; file < kFilesPerFolder; ++file) {
            for (u32 folder = 0; folder < kFolders; ++folder) {
                const u32 id = nextId_++;
                Insert(folderIds_[folder], FileName(folder, file),
                       fmt::format("file{{id:{},mode:0100644,created:2026-10-29T00:00:00Z}}", id),
                       id, 2);
                figures_->inserted += 1;
            }
        }
        figures_->folders = kFolders;
        Commit();
    }

    // Every third file of each folder goes.
    void Thin() {
        for (u32 folder = 0; folder < kFolders; ++folder) {
            u32 left = kFilesPerFolder;
            for (u32 file = 0; file < kFilesPerFolder; file += 3, --left) {
                const u32 id = kFirstId + kFolders + file * kFolders + folder;
                Delete(folderIds_[folder], FileName(folder, file), id, 2);
                figures_->deleted += 1;
            }
            SetValence(kRoot, FolderName(folder), left);
        }
        Commit();
    }

private:
    static std::string FolderName(u32 folder) {
        return fmt::format("{} {}", kWords[folder % kWords.size()], folder);
    }
    static std::string FileName(u32 folder, u32 file) {
        return fmt::format("{} of {}.txt", kWords[(folder + file) % kWords.size()], file);
    }

    void Must(int status, const char* what) {
        if (status != kOk) {
            ThrowFailed("demo", fmt::format("{}: {}", what, StatusWithCode(status)), "");
        }
    }
    static SearchKey KeyOf(u32 parent, const std::string& name) {
        SearchKey key;
        const Problem problem =
            ParseKey(fmt::format("{}:\"{}\"", parent, name), kCatalogFileId, &key);
        if (problem) {
            ThrowProblem("demo", problem);
        }
        return key;
    }

    void InsertRecord(u32 parent, const std::string& name, const std::string& text) {
        RecordData data;
        if (const Problem problem = ParseData(text, kCatalogFileId, &data)) {
            ThrowProblem("demo", problem);
        }
        const u32 size = static_cast<u32>(data.stored.size());
        ConvertFor(kCatalogFileId).DataToMemory(data.stored.data(), data.stored.data(), size);
        const SearchKey key = KeyOf(parent, name);
        Must(tree_->InsertRecord(key.Key(), key.id, data.stored.data(), size), "insert");
    }
    void Insert(u32 parent, const std::string& name, const std::string& record, u32 id, u16 type) {
        InsertRecord(parent, name, record);
        InsertRecord(id, "",
                     fmt::format("{}{{parent:{},name:\"{}\"}}",
                                 type == 1 ? "thread" : "thread-file", parent, name));
        volume_->CountCatalogRecord(type, id, 1);
    }
    void Delete(u32 parent, const std::string& name, u32 id, u16 type) {
        const SearchKey key = KeyOf(parent, name);
        Must(tree_->DeleteRecord(key.Key(), key.id, false), "delete");
        const SearchKey thread = KeyOf(id, "");
        Must(tree_->DeleteRecord(thread.Key(), thread.id, false), "delete");
        volume_->CountCatalogRecord(type, id, -1);
    }
    // Writes the number of items into a folder's record, in place.
    void SetValence(u32 parent, const std::string& name, u32 items) {
        const SearchKey key = KeyOf(parent, name);
        alignas(8) u8 record[kMaxKeyLength];
        unsigned size = 0;
        Must(tree_->FindRecord(key.Key(), key.id, record, sizeof record, &size, nullptr), "find");
        std::memcpy(record + kValenceAt, &items, sizeof items);
        Must(tree_->UpdateKeyAndRecord(nullptr, record), "update");
    }
    void Commit() { Must(volume_->Commit(0), "commit"); }

    ImageVolume* volume_;
    CBTreeHfs* tree_;
    DemoFigures* figures_;
    std::vector<u32> folderIds_;
    u32 nextId_ = kFirstId;
};

}  // namespace

std::unique_ptr<ImageVolume> MakeDemoVolume(DemoFigures* figures) {
    FormatOptions options;
    options.name = u"Demo";
    options.date = kDate;
    options.uuid = 0x7472656568667321;
    Problem problem;
    std::unique_ptr<ImageVolume> volume = MakeMemoryVolume(kVolumeBytes, options, &problem);
    if (!volume) {
        ThrowProblem("demo", problem);
    }
    DemoMaker maker(volume.get(), figures);
    maker.Fill();
    maker.Thin();
    return volume;
}

}  // namespace VELK::tool
