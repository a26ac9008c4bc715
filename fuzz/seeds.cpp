// Writes inputs for the fuzz targets to start from: FOLDER/<target>/<name>.
#include <filesystem>
#include <fstream>

#include "fuzz.h"
#include "hfs/volume/make_volume.h"
#include "journal_base.h"
#include "keys.h"
#include "node_image.h"
#include "tree_image.h"

namespace {

using namespace VELK;
using test::Bytes;

std::filesystem::path folder;

void Write(const std::string& target, const std::string& name, const Bytes& control,
           const Bytes& body) {
    std::filesystem::create_directories(folder / target);
    std::ofstream file(folder / target / name, std::ios::binary | std::ios::trunc);
    for (const Bytes* part : {&control, &body}) {
        file.write(reinterpret_cast<const char*>(part->data()),
                   static_cast<std::streamsize>(part->size()));
    }
}

void Nodes() {
    test::NodeImage leaf;
    test::NodeImage index;
    index.kind = kBTIndexNode;
    index.height = 2;
    for (u32 n = 0; n < 7; ++n) {
        const Bytes key = test::NthDiskKey(kCatalogFileId, n);
        leaf.records.push_back(test::Record(key, test::Pattern(10 + 4 * n, n)));
        index.records.push_back(test::Record(key, 5 + n));
    }
    Write("node", "leaf", {0, 0}, leaf.Build(512));
    Write("node", "leaf-of-two-blocks", {1, 0}, leaf.Build(1024));
    Write("node", "index", {0, 0}, index.Build(512));
    Write("node", "index-of-eight-blocks", {2, 0}, index.Build(4096));
    test::TreeShape shape;
    Write("node", "header", {0, 1}, test::BuildTree(shape, {}).Node(0));
}

void Trees() {
    const u32 files[] = {kCatalogFileId, kExtentsFileId, kAttributesFileId};
    for (u8 kind = 0; kind < 3; ++kind) {
        for (const u32 records : {0u, 5u, 80u}) {
            test::TreeShape shape;
            shape.fileId = files[kind];
            shape.nodeSize = records == 5 ? 1024 : 512;
            shape.mapNodes = records == 80 ? 1 : 0;
            const auto tree = test::BuildTree(
                shape, test::NthRecords(shape.fileId, records, kind == 1 ? 64 : 40));
            const std::string name = std::to_string(shape.fileId) + "-" + std::to_string(records);
            Write("open", name + "-read", {kind, 0, 0}, tree.bytes);
            Write("open", name + "-change", {kind, 4, 7}, tree.bytes);
        }
    }
}

void Operations() {
    for (u8 kind = 0; kind < 3; ++kind) {
        Bytes rise;
        Bytes mixed;
        for (u32 i = 0; i < 250; ++i) {
            const u8 n = static_cast<u8>(i);
            const u8 scattered = static_cast<u8>(i * 97);
            test::AppendBytes(&rise, {0, n, static_cast<u8>(40 + i % 60)});
            test::AppendBytes(&mixed, {static_cast<u8>(i % 8), scattered, n});
            test::AppendBytes(&mixed, {0x11, static_cast<u8>(i * 31), n});
        }
        for (u32 i = 0; i < 250; ++i) {
            test::AppendBytes(&rise, {3, static_cast<u8>(i * 7), 0});
        }
        const std::string name = std::to_string(kind);
        Write("ops", "rise-and-fall-" + name, {kind, 0}, rise);
        Write("ops", "mixed-" + name, {kind, 0x14}, mixed);
        Write("ops", "mixed-in-two-blocks-" + name, {kind, 0x11}, mixed);
    }
}

void Images() {
    for (const bool caseSensitive : {false, true}) {
        FormatOptions options;
        options.caseSensitive = caseSensitive;
        options.blockSize = 512;
        options.catalogNodeSize = 1024;
        options.extentsNodeSize = 512;
        options.attributesNodeSize = 1024;
        options.clumpSize = 8192;
        Problem problem;
        const auto volume = MakeMemoryVolume(128 << 10, options, &problem);
        FUZZ_CHECK(volume != nullptr);
        char* text = nullptr;
        std::size_t size = 0;
        std::FILE* stream = open_memstream(&text, &size);
        const Problem saved = volume->SaveTo(stream);
        std::fclose(stream);
        const Bytes image(text, text + size);
        std::free(text);
        FUZZ_CHECK(!image.empty());
        const std::string name = caseSensitive ? "sensitive" : "plain";
        Write("image", name + "-read", {0, 0}, image);
        Write("image", name + "-change", {1, 1}, image);
        Write("image", name + "-full", {8, 0}, image);
    }
}

// Header and first transaction; the seed's first byte says which checksums are mended.
void Journals() {
    const fuzz::JournalBase base = fuzz::MakeJournalBase();
    const auto journal = base.image.begin() + static_cast<std::ptrdiff_t>(base.journalOffset);
    Write("journal", "as-it-is", {0}, Bytes(journal, journal + 8192));
    Write("journal", "header-mended", {1}, Bytes(journal, journal + 8192));
    Write("journal", "both-mended", {3}, Bytes(journal, journal + 5120));
}

}  // namespace

int main(int argc, char** argv) {
    if (argc != 2) {
        std::fprintf(stderr, "usage: fuzz_seeds FOLDER\n");
        return 16;
    }
    const fuzz::Quiet quiet;
    folder = argv[1];
    Nodes();
    Trees();
    Operations();
    Images();
    Journals();
    Write("canary", "harmless", {}, {'b', 'i', 'r'});
    return 0;
}
