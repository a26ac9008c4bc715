// Chains that lead back into themselves: leaves, index nodes, map nodes, folders. Every listing
// ends with the right exit code after about the work it takes on the volume nobody hurt. Work is
// counted, not timed: lines told, reads of the image, allocations of the engine (one for each node
// it loads).
#include <gtest/gtest.h>

#include <algorithm>
#include <fstream>

#include "heap_guard.h"
#include "keys.h"
#include "program_run.h"
#include "specimen.h"

namespace VELK::test {

namespace {

struct Ring {
    const char* name;
    const char* tree;  // that is hurt, and dumped
    void (*make)(Specimen& s);
    int ls, dump, check;  // exit codes
};

void PrintTo(const Ring& ring, std::ostream* out) {
    *out << ring.name;
}

void Follow(NodeHandle node, u32 next) {
    node.Set32(kDescFLink, next);
}

const Ring kRings[] = {
    {"LeafToItself", "catalog",
     [](Specimen& s) { Follow(s.catalog.Leaf(3), s.catalog.LeafNumber(3)); }, 8, 8, 4},
    {"LeafToTheOneBefore", "catalog",
     [](Specimen& s) { Follow(s.catalog.Leaf(3), s.catalog.LeafNumber(2)); }, 8, 8, 4},
    {"LastLeafToTheFirst", "catalog",
     [](Specimen& s) { Follow(s.catalog.Node(s.catalog.LastLeaf()), s.catalog.LeafNumber(0)); }, 8,
     8, 4},
    {"EmptyLeaves", "catalog",
     [](Specimen& s) {
         s.catalog.Leaf(3).Set16(kDescNumRecords, 0);
         s.catalog.Leaf(4).Set16(kDescNumRecords, 0);
         Follow(s.catalog.Leaf(4), s.catalog.LeafNumber(3));
     },
     8, 8, 4},
    {"EveryLeafEmptyAndBeforeARing", "catalog",
     [](Specimen& s) {
         s.Widen();
         for (const u32 leaf : s.catalog.Image().levels[1]) {
             s.catalog.Node(leaf).Set16(kDescNumRecords, 0);
             Follow(s.catalog.Node(leaf), s.catalog.LeafNumber(0));
         }
     },
     8, 8, 4},
    {"FirstLeafBackToTheLast", "catalog",
     [](Specimen& s) { s.catalog.Leaf(0).Set32(kDescBLink, s.catalog.LastLeaf()); }, 0, 0, 4},
    {"ExtentsLeafToItself", "extents",
     [](Specimen& s) { Follow(s.extents.Leaf(0), s.extents.LeafNumber(0)); }, 0, 8, 4},
    {"AttributesLastLeafToTheFirst", "attributes",
     [](Specimen& s) {
         Follow(s.attributes.Node(s.attributes.LastLeaf()), s.attributes.LeafNumber(0));
     },
     0, 8, 4},
    {"IndexNodeToItself", "catalog",
     [](Specimen& s) { Follow(s.catalog.Index(2, 0), s.catalog.IndexNumber(2, 0)); }, 0, 0, 4},
    {"ChildOfTheRootIsTheRoot", "catalog",
     [](Specimen& s) { s.catalog.Root().SetData32(1, 0, s.catalog.Image().rootNode); }, 0, 0, 4},
    {"ChildOfAnIndexNodeIsItself", "catalog",
     [](Specimen& s) { s.catalog.Index(2, 0).SetData32(1, 0, s.catalog.IndexNumber(2, 0)); }, 0, 0,
     4},
    {"MapNodeToItself", "catalog",
     [](Specimen& s) {
         s.Widen();
         Follow(s.catalog.MapNode(0), s.catalog.MapNumber(0));
     },
     0, 0, 4},
    {"FolderInItself", "catalog",
     [](Specimen& s) {
         s.Erase(&s.volume.catalog, DiskCatKey(2, u"dir"));
         s.volume.catalog.push_back({DiskCatKey(16, u"dir"), FolderData(16, 9)});
         Put32(&s.CatalogData(DiskCatKey(16, u"")), 4, 16);
         s.volume.Sort();
         s.Rebuild();
     },
     8, 0, 4},
};

// What a command took.
struct Work {
    int exitCode = 0;
    u64 lines = 0;
    u64 reads = 0;
    u64 allocations = 0;
};

// System calls that read, of this process so far; 0 where the host does not tell.
u64 ReadCalls() {
    std::ifstream io("/proc/self/io");
    std::string name;
    u64 value = 0;
    while (io >> name >> value) {
        if (name == "syscr:") {
            return value;
        }
    }
    return 0;
}

Work WorkOf(ProgramRun* run, const char* command, const std::vector<std::string>& arguments) {
    HeapGuard heap;
    const u64 before = ReadCalls();
    const Told told = run->Run(command, arguments);
    Work work;
    work.exitCode = told.exitCode;
    work.reads = ReadCalls() - before;
    work.allocations = heap.Allocations();
    work.lines = static_cast<u64>(std::count(told.out.begin(), told.out.end(), '\n') +
                                  std::count(told.err.begin(), told.err.end(), '\n'));
    return work;
}

struct Listings {
    Work ls, dump, check;

    Listings(const Bytes& image, const char* tree) {
        ProgramRun run(image);
        ls = WorkOf(&run, "ls", {"-R", "IMAGE"});
        dump = WorkOf(&run, "dump", {"IMAGE", "--tree", tree});
        check = WorkOf(&run, "check", {"--full", "IMAGE"});
    }
};

// A step through a ring of empty leaves asks for every node before it knows; so may a few of them.
// A node loaded takes two allocations.
void ExpectAboutTheWork(const char* command, const Work& sound, const Work& hurt, u64 nodes) {
    EXPECT_LE(hurt.lines, 2 * sound.lines + 64) << command;
    EXPECT_LE(hurt.reads, 4 * sound.reads + 6 * (nodes + 64)) << command;
    EXPECT_LE(hurt.allocations, 4 * sound.allocations + 12 * (nodes + 64)) << command;
}

class RingTest : public ::testing::TestWithParam<Ring> {};

TEST_P(RingTest, ListingsEndWithTheirExitCode) {
    Specimen hurtOne;
    GetParam().make(hurtOne);
    const u64 nodes = hurtOne.catalog.Image().totalNodes;
    Specimen soundOne;
    if (nodes != soundOne.catalog.Image().totalNodes) {
        soundOne.Widen();
    }
    const Listings sound(soundOne.bytes, GetParam().tree);
    const Listings hurt(hurtOne.bytes, GetParam().tree);
    EXPECT_EQ(hurt.ls.exitCode, GetParam().ls);
    EXPECT_EQ(hurt.dump.exitCode, GetParam().dump);
    EXPECT_EQ(hurt.check.exitCode, GetParam().check);
    ExpectAboutTheWork("ls", sound.ls, hurt.ls, nodes);
    ExpectAboutTheWork("dump", sound.dump, hurt.dump, nodes);
    ExpectAboutTheWork("check", sound.check, hurt.check, nodes);
}
INSTANTIATE_TEST_SUITE_P(Museum, RingTest, ::testing::ValuesIn(kRings),
                         [](const auto& ring) { return std::string(ring.param.name); });

}  // namespace

// The counters count: the volume nobody hurt takes some of each.
TEST(Rings, SoundVolumesAreWhatIsComparedWith) {
    const Specimen specimen;
    const Listings sound(specimen.bytes, "catalog");
    EXPECT_EQ(sound.ls.exitCode, 0);
    EXPECT_EQ(sound.dump.exitCode, 0);
    EXPECT_EQ(sound.check.exitCode, 0);
    EXPECT_GT(sound.ls.lines, 5u);
    EXPECT_GT(sound.dump.lines, 20u);
    EXPECT_GT(sound.ls.allocations, 5u);
    EXPECT_GT(sound.dump.allocations, 20u);
}

}  // namespace VELK::test
