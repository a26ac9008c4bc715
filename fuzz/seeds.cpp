// Writes inputs for the fuzz targets to start from: FOLDER/<target>/<name>.
#include <filesystem>
#include <fstream>

#include "disk_builder.h"
#include "fuzz.h"
#include "hfs/volume/make_volume.h"
#include "journal_base.h"
#include "keys.h"
#include "node_image.h"
#include "specimen.h"
#include "tree_image.h"
#ifdef TREEHFS_WITH_SCRIPTS
#include "tool/script.h"
#endif

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
    Write("node", "leaf", {0, 0, 0x40, 2, 0, 14, 0x40, 3, 1, 255}, leaf.Build(512));
    Write("node", "leaf-of-two-blocks", {1, 0, 0x40, 2, 0, 14, 0x40, 3, 1, 255}, leaf.Build(1024));
    Write("node", "index", {0, 0, 0x40, 2, 0, 14, 0x40, 3, 1, 255}, index.Build(512));
    Write("node", "index-of-eight-blocks", {2, 0, 0x40, 2, 0, 14, 0x40, 3, 1, 255},
          index.Build(4096));
    test::TreeShape shape;
    Write("node", "header", {0, 1, 0, 2, 0, 14, 0, 3, 1, 255}, test::BuildTree(shape, {}).Node(0));
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
            Write("open", name + "-change", {kind, 4, 3}, tree.bytes);
            Write("open", name + "-all", {kind, 4, 15}, tree.bytes);
        }
    }
    test::TreeShape binary;
    binary.keyCompareType = kKeyCompareBinary;
    const auto tree = test::BuildTree(binary, test::NthRecords(kCatalogFileId, 80, 40));
    Write("open", "binary", {0, 8, 7}, tree.bytes);
}

// Keys that come in any order and are there when the other operations ask for them.
Bytes Settled() {
    Bytes settled;
    for (u32 i = 0; i < 400; ++i) {
        const u8 key = static_cast<u8>(i * 37);
        test::AppendBytes(&settled, {0, key, static_cast<u8>(i * 5)});
        const u8 earlier = static_cast<u8>(i / 2 * 37);
        test::AppendBytes(&settled, {static_cast<u8>(3 + i % 5), earlier, static_cast<u8>(i / 5)});
    }
    return settled;
}

void Operations() {
    for (u8 kind = 0; kind < 3; ++kind) {
        Bytes rise;
        Bytes mixed;
        for (u32 i = 0; i < 250; ++i) {
            const u8 n = static_cast<u8>(i);
            const u8 scattered = static_cast<u8>(i * 97);
            test::AppendBytes(&rise, {0, n, static_cast<u8>(40 + i % 60)});
            test::AppendBytes(&mixed,
                              {static_cast<u8>(i % 8), scattered, static_cast<u8>(i + i / 8)});
            test::AppendBytes(&mixed, {0x11, static_cast<u8>(i * 31), n});
        }
        for (u32 i = 0; i < 250; ++i) {
            test::AppendBytes(&rise, {3, static_cast<u8>(i * 7), 0});
        }
        const std::string name = std::to_string(kind);
        Write("ops", "rise-and-fall-" + name, {kind, 0}, rise);
        Write("ops", "mixed-" + name, {kind, 0x14}, mixed);
        Write("ops", "mixed-in-two-blocks-" + name, {kind, 0x11}, mixed);
        Bytes grown = Settled();
        test::AppendBytes(&grown, {0x96, 0, 5});  // by so many nodes that the map needs another one
        test::AppendBytes(&grown, mixed);
        Write("ops", "grown-" + name, {kind, 0}, grown);
        Write("ops", "settled-" + name, {kind, 0x10}, Settled());
        Write("ops", "made-here-" + name, {kind, 8}, rise);
        Write("ops", "made-here-settled-" + name, {kind, 8}, Settled());
        Write("ops", "made-here-mixed-" + name, {kind, 0x49}, mixed);
    }
}

// One image, opened in several ways.
void Image(const std::string& name, const Bytes& image) {
    Write("image", name + "-read", {0, 0}, image);
    Write("image", name + "-change", {1, 1}, image);
    Write("image", name + "-change-much", {1, 0x7D}, image);
    Write("image", name + "-rise-and-fall", {1, 0x3B}, image);
    Write("image", name + "-change-in-small-blocks", {5, 0x75}, image);
    Write("image", name + "-write", {0x80, 1}, image);
    Write("image", name + "-force", {0x80, 0x81}, image);
    Write("image", name + "-full", {8, 0}, image);
}

// Volumes just made, where nothing is; one where everything is, files in pieces too; one whose
// journal holds a transaction.
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
        Image(caseSensitive ? "sensitive" : "plain", image);
    }
    test::Specimen specimen;
    specimen.Narrow();
    Image("full", specimen.bytes);
    const fuzz::JournalBase base = fuzz::MakeJournalBase();
    Image("journal", base.image);
    Write("image", "journal-replay", {0x41, 1}, base.image);
    Write("image", "journal-replay-write", {0xC0, 1}, base.image);
}

// Header and first transaction; the seed's first byte says which checksums are mended.
void Journals() {
    const fuzz::JournalBase base = fuzz::MakeJournalBase();
    const auto journal = base.image.begin() + static_cast<std::ptrdiff_t>(base.journalOffset);
    Write("journal", "as-it-is", {0}, Bytes(journal, journal + 8192));
    Write("journal", "header-mended", {1}, Bytes(journal, journal + 8192));
    Write("journal", "both-mended", {3}, Bytes(journal, journal + 5120));
}

// The head of each kind of disk, and the volume's header sector.
void Finder() {
    const Bytes volume = test::DiskVolume{}.Build();
    const Bytes sector(volume.begin() + 1024, volume.begin() + 1536);
    const auto write = [&sector](const char* name, const Bytes& control, Bytes disk,
                                 std::size_t head) {
        disk.resize(head);
        Bytes body = sector;
        test::AppendBytes(&body, disk);
        Write("finder", name, control, body);
    };
    const Bytes usual = {0, 17 << 2, 1};
    write("bare", usual, volume, 2048);
    write("apm", usual, test::InApm(volume, 512), 2560);
    write("apm-2048", usual, test::InApm(volume, 2048), 8192);
    write("gpt", usual, test::InGpt(volume, 512), 2048);
    write("gpt-chosen", {4, 17 << 2, 1}, test::InGpt(volume, 512), 2048);
    write("mbr", usual, test::InMbr(volume), 512);
    write("mbr-lenient", {1, 17 << 2, 1}, test::InMbr(volume), 512);
    write("wrapper", usual, test::InWrapper(volume), 2048);
    write("nothing", usual, Bytes(1024), 1024);
}

// Each is accepted: one that is refused leads nowhere.
void Scripts() {
    const std::pair<const char*, const char*> scripts[] = {
        {"keys",
         "use extents\ninsert 16:data:0 extents{[[1,2],[9,4]]}\nuse attributes\n"
         "insert 37:\"com.example.tag\" inline{\"text\"}\nfind 37:big:8\nuse catalog\n"
         "get hex:0006000000020000\nseek first\nnext 3\nprev\nhere\npos\ngoto 4294967296\n"},
        {"changes",
         "#!treehfs apply --script 1\ncreate 9\nrepeat 20\n"
         "insert 2:\"n$i\" file{id:$i,size:1107,data:[[17,1]]} # a comment\nexpect ok\n"
         "repeat 2\nfind $j:x$i\nend\nend\nupdate 2:n1 zero:248\ndelete 2:n2\nflush\n"
         "replace 2:n3 folder{id:9,valence:3,created:2001-01-01T00:00:00}\nexpect exists\n"},
        {"looks",
         "state\nheader\nnode 0\ncheck quick\nstats\ndigest\nshow data\nset trace on\n"
         "repeat 2\necho $i anything\nend\nwalk 5\nreserve 3\nrelease\nextend "
         "20\nclear\nrestore\nreopen\n"
         "badblocks\nfail alloc after 3\nwalk 2\n"},
        {"records",
         "insert 2:\"a b\" file{id:20,size:1107,data:[[17,1],[30,2]],rsrc:[[40,3]],rblocks:9,"
         "created:2001-02-03T04:05:06,mode:0100644,filetype:\"TEXT\",flags:0x2,xflags:1}\n"
         "update 2:a folder{id:9,valence:3,modified:3000000000,backup:2001-02-03,mode:493}\n"
         "insert 9:\"\" thread{parent:2,name:\"a b\"}\n"
         "insert 20:\"\" thread-file{parent:2,name:b}\nuse extents\n"
         "insert 16:rsrc:8 extents{[[1,2]]}\ninsert 17:data:0 zero:64\nuse attributes\n"
         "insert 37:t fork{size:5,data:[[9,1]]}\ninsert 37:t:8 extents{[[9,1]]}\n"
         "insert 37:u inline{hex:00ff}\ninsert 37:v fill:7F*30\ninsert 37:w seq:9\n"
         "update 37:w same\n"},
    };
    for (const auto& [name, text] : scripts) {
        const std::string all = text;
#ifdef TREEHFS_WITH_SCRIPTS
        tool::ScriptContext context;
        tool::Script script;
        FUZZ_CHECK(!tool::ParseScript(name, all, &context, &script));
#endif
        Write("script", name, {12}, Bytes(all.begin(), all.end()));
    }
}

}  // namespace

int main(int argc, char** argv) {
    if (argc != 2) {
        std::fprintf(stderr, "usage: fuzz_seeds FOLDER\n");
        return 16;
    }
    const test::Quiet quiet;
    folder = argv[1];
    Nodes();
    Trees();
    Operations();
    Images();
    Journals();
    Finder();
    Scripts();
    Write("canary", "harmless", {}, {'b', 'i', 'r'});
    return 0;
}
