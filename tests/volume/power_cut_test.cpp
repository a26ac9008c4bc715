// Power cuts, enumerated: whatever a cut leaves of the writes of a commit, the volume that mounts
// afterwards is the one before the commit or the one after it. So is the one that mounts after cuts
// inside the carrying out of the journal.
//
// TREEHFS_POWER_CUTS=N goes on with rows of operations until N states have been looked at;
// TREEHFS_POWER_CUTS=all, until every row of up to three has had its turn.
#include <gtest/gtest.h>

#include <cstdlib>

#include "capture.h"
#include "cut_operations.h"
#include "hfs/volume/wire.h"
#include "power_cut.h"

namespace VELK {
namespace {

using test::Cut;
using test::CutBase;
using test::CutLimits;
using test::CutVolume;
using test::DeviceEvent;
using test::Epoch;

// One commit of a recorded run.
struct Mark {
    std::size_t begin;  // events before it
    std::size_t end;    // events when it had returned
    std::vector<u8> essence;
};

// A run of operations with a commit after each, recorded.
class RecordedRun {
public:
    RecordedRun(const CutBase& base, const std::vector<u32>& operations)
        : device_(test::DeviceWith(base.bytes)) {
        place_ = HasJournal(base.bytes) ? test::JournalOf(device_.get()) : JournalPlace{};
        marks.push_back({0, 0, test::Essence(base.bytes, place_)});
        test::RecordingDevice recorder(device_.get(), &log);
        Problem problem;
        auto volume = test::MountOn(&recorder, test::Writing(), &problem);
        EXPECT_NE(nullptr, volume) << problem.Text();
        CutVolume on{volume.get(), base.numbers, [&] { return Commit(volume.get()); }};
        for (const u32 operation : operations) {
            const std::set<u32> before = on.numbers;
            int status = test::DoCutOperation(operation, &on);
            status = status == 0 ? Commit(volume.get()) : status;
            if (status != 0) {
                EXPECT_TRUE(status == kErrNoSpace || status == kErrVolumeJournal)
                    << test::CutOperationName(operation) << " " << StatusWithCode(status);
                volume->RestoreAfter(status);
                on.numbers = before;
                break;
            }
        }
        EXPECT_EQ(0, volume->Close());
    }

    const JournalPlace& Place() const { return place_; }
    BlockDevice* Device() { return device_.get(); }
    // States that may be found after a cut between `epoch`'s syncs: [first, last].
    void Allowed(Epoch epoch, std::size_t* first, std::size_t* last) const {
        *first = 0;
        *last = 0;
        for (std::size_t i = 1; i < marks.size(); ++i) {
            *first = marks[i].end <= epoch.end ? i : *first;
            *last = marks[i].begin < epoch.end ? i : *last;
        }
    }

    std::vector<DeviceEvent> log;
    std::vector<Mark> marks;

private:
    static bool HasJournal(const std::vector<u8>& bytes) {
        return (Be32(bytes.data() + kHeaderOffset + 4) & kVolJournaled) != 0;
    }
    int Commit(ImageVolume* volume) {
        const std::size_t begin = log.size();
        const int status = volume->Commit(0);
        if (status == 0 && log.size() != begin) {
            marks.push_back(
                {begin, log.size(), test::Essence(test::BytesOf(device_.get()), place_)});
            // The states that cuts are compared with: trees, bitmap and headers agree in each.
            EXPECT_EQ("", test::CheckAll(device_.get()));
        }
        return status;
    }

    std::unique_ptr<MemoryDevice> device_;
    JournalPlace place_;
};

// Looks at every cut of a run.
class Cutter {
public:
    Cutter(const CutBase& base, const std::vector<u32>& operations, const CutLimits& limits)
        : limits_(limits), run_(base, operations), stable_(test::DeviceWith(base.bytes)) {
        for (const u32 operation : operations) {
            name_ += std::string(name_.empty() ? "" : ", ") + test::CutOperationName(operation);
        }
    }

    void Go() {
        for (const Epoch& epoch : test::EpochsOf(run_.log)) {
            run_.Allowed(epoch, &first_, &last_);
            test::ForEachCut(run_.log, epoch, limits_, &random_,
                             [&](const Cut& cut) { Look(cut); });
            test::ApplyEpoch(run_.log, epoch, stable_.get());
            if (testing::Test::HasFatalFailure() || wrong != 0) {
                ADD_FAILURE() << wrong << " wrong states: " << name_ << ", events " << epoch.first
                              << " to " << epoch.end << " of " << run_.log.size();
                return;
            }
        }
        EXPECT_EQ("", test::CheckAll(stable_.get())) << name_;
    }

    RecordedRun* TheRun() { return &run_; }
    u64 states = 0;
    u64 replays = 0;
    u64 replayCuts = 0;
    u64 wrong = 0;

private:
    void Look(const Cut& cut) {
        states += 1;
        OverlayDevice state(stable_.get());
        test::ApplyCut(cut, &state);
        OverlayDevice after(&state);
        std::vector<DeviceEvent> log;
        std::vector<u8> essence;
        if (!Mounts(&after, &log, &essence)) {
            wrong += 1;
            return;
        }
        bool isKnown = false;
        for (std::size_t i = first_; i <= last_ && !isKnown; ++i) {
            isKnown = essence == run_.marks[i].essence;
        }
        wrong += isKnown ? 0u : 1u;
        if (!log.empty()) {
            replays += 1;
            if (replays % 16 == 1) {
                CutReplay(&state, log, essence);
            }
        }
    }

    // Mounts for writing, carries the journal out, unmounts.
    bool Mounts(BlockDevice* device, std::vector<DeviceEvent>* log, std::vector<u8>* essence) {
        test::RecordingDevice recorder(device, log);
        Problem problem;
        auto volume = test::MountOn(&recorder, test::Writing(), &problem);
        EXPECT_NE(nullptr, volume) << problem.Text() << ": " << name_;
        if (volume) {
            volume.reset();
            *essence = test::Essence(test::BytesOf(device), run_.Place());
        }
        return !essence->empty();
    }

    // What a cut leaves of the carrying out gives the same volume when it is mounted once more.
    void CutReplay(BlockDevice* state, const std::vector<DeviceEvent>& log,
                   const std::vector<u8>& expected) {
        CutLimits few = limits_;
        few.allSubsets = 4;
        few.randomSubsets = 8;
        OverlayDevice done(state);
        for (const Epoch& epoch : test::EpochsOf(log)) {
            test::ForEachCut(log, epoch, few, &random_, [&](const Cut& cut) {
                replayCuts += 1;
                OverlayDevice again(&done);
                test::ApplyCut(cut, &again);
                std::vector<DeviceEvent> ignored;
                std::vector<u8> essence;
                wrong += Mounts(&again, &ignored, &essence) && essence == expected ? 0u : 1u;
            });
            test::ApplyEpoch(log, epoch, &done);
        }
    }

    CutLimits limits_;
    RecordedRun run_;
    std::unique_ptr<MemoryDevice> stable_;
    std::mt19937_64 random_{20260921};
    std::string name_;
    std::size_t first_ = 0;
    std::size_t last_ = 0;
};

u64 WantedStates() {
    const char* text = std::getenv("TREEHFS_POWER_CUTS");
    return text == nullptr              ? 20000
           : std::string(text) == "all" ? ~u64{0}
                                        : std::strtoull(text, nullptr, 10);
}

// The four settings: fresh or nearly full, the journal in one piece or around its end.
std::vector<CutBase> Settings() {
    std::vector<CutBase> bases;
    for (const bool nearlyFull : {false, true}) {
        for (const u64 journalAt : {u64{512}, u64{30} << 10}) {
            test::CutBaseShape shape;
            shape.nearlyFull = nearlyFull;
            shape.records = nearlyFull ? 40 : 3;
            shape.journalAt = journalAt;
            bases.push_back(test::MakeCutBase(shape));
        }
    }
    return bases;
}

struct Totals {
    u64 states = 0;
    u64 replays = 0;
    u64 replayCuts = 0;
    u64 commits = 0;

    void Add(Cutter* cutter) {
        states += cutter->states + cutter->replayCuts;
        replays += cutter->replays;
        replayCuts += cutter->replayCuts;
        commits += cutter->TheRun()->marks.size() - 1;
    }
    void Tell() const {
        testing::Test::RecordProperty("states", static_cast<int>(states));
        std::printf(
            "%llu states of %llu commits, %llu carried out, %llu cuts inside that\n",
            static_cast<unsigned long long>(states), static_cast<unsigned long long>(commits),
            static_cast<unsigned long long>(replays), static_cast<unsigned long long>(replayCuts));
    }
};

void CutRow(const CutBase& base, const std::vector<u32>& operations, const CutLimits& limits,
            Totals* totals) {
    Cutter cutter(base, operations, limits);
    cutter.Go();
    totals->Add(&cutter);
}

TEST(PowerCut, EachOperationInEachSetting) {
    test::Capture capture;
    const CutLimits limits;
    Totals totals;
    for (const CutBase& base : Settings()) {
        for (u32 operation = 0; operation < test::kCutOperations; ++operation) {
            CutRow(base, {operation}, limits, &totals);
            ASSERT_FALSE(HasFailure());
        }
    }
    totals.Tell();
    EXPECT_GT(totals.states, 3000u);
    EXPECT_GT(totals.replays, 500u);
}

// Rows of two and three operations, in an order that mixes them, until there are enough states or
// every row has had its turn in every setting.
TEST(PowerCut, RowsOfOperations) {
    test::Capture capture;
    const CutLimits limits;
    const std::vector<CutBase> bases = Settings();
    const u32 n = test::kCutOperations;
    const u32 rows = n * n + n * n * n;
    Totals totals;
    u32 done = 0;
    for (; done < rows && totals.states < WantedStates(); ++done) {
        // The step has no factor in common with the number of rows, so each row has its turn.
        const u32 row = done * 1009 % rows;
        const u32 triple = row - n * n;
        const std::vector<u32> operations =
            row < n * n ? std::vector<u32>{row / n, row % n}
                        : std::vector<u32>{triple / n / n, triple / n % n, triple % n};
        for (const CutBase& base : bases) {
            CutRow(base, operations, limits, &totals);
            ASSERT_FALSE(HasFailure());
        }
    }
    std::printf("%u of %u rows in each of %zu settings: ", done, rows, bases.size());
    totals.Tell();
    EXPECT_TRUE(totals.states >= WantedStates() || done == rows);
}

// A tree that grows past what its header's map holds, so that a map node is added.
TEST(PowerCut, GrowthWithAMapNode) {
    test::Capture capture;
    test::CutBaseShape shape;
    shape.size = 1536 << 10;
    shape.journalSize = 64 << 10;
    shape.records = 8;
    shape.catalogNodes = 2046;
    CutLimits limits;
    limits.allSubsets = 6;
    limits.randomSubsets = 40;
    Totals totals;
    CutRow(test::MakeCutBase(shape), {8, 1}, limits, &totals);
    totals.Tell();
    EXPECT_GT(totals.states, 50u);
}

// Transactions of more than half of the ring: each has to wait until the one before is let go of.
TEST(PowerCut, TransactionsThatFillTheJournal) {
    test::Capture capture;
    for (const u64 journalAt : {u64{512}, u64{20} << 10}) {
        test::CutBaseShape shape;
        shape.records = 180;
        shape.journalAt = journalAt;
        CutLimits limits;
        limits.randomSubsets = 30;
        Totals totals;
        CutRow(test::MakeCutBase(shape), {test::kUpdateAll, test::kUpdateAll, test::kUpdateAll},
               limits, &totals);
        totals.Tell();
        EXPECT_EQ(3u, totals.commits);
        EXPECT_GT(totals.replays, 20u);
    }
}

// The last writer was one that keeps no journal, and unmounted: the first commit changes that.
TEST(PowerCut, TheFirstCommitAfterAnotherWriter) {
    test::Capture capture;
    CutBase base = test::MakeCutBase({});
    StoreBe32(base.bytes.data() + kHeaderOffset + 8, 0x31302E30);
    Totals totals;
    CutRow(base, {0, 3}, CutLimits{}, &totals);
    totals.Tell();
    EXPECT_EQ(2u, totals.commits);
    EXPECT_GT(totals.replays, 20u);
}

// Without a journal a cut may leave anything, but never a volume that calls itself clean and is
// neither the one before nor the one after.
TEST(PowerCut, WithoutAJournalTheCleanBitTells) {
    test::Capture capture;
    test::CutBaseShape shape;
    shape.journalSize = 0;
    shape.records = 20;
    const CutBase base = test::MakeCutBase(shape);
    const CutLimits limits{8, 100, 4};
    u64 states = 0;
    u64 unclean = 0;
    u64 mixed = 0;
    for (u32 operation = 0; operation < test::kCutOperations; ++operation) {
        RecordedRun run(base, {operation});
        auto stable = test::DeviceWith(base.bytes);
        std::mt19937_64 random(7);
        for (const Epoch& epoch : test::EpochsOf(run.log)) {
            std::size_t first = 0;
            std::size_t last = 0;
            run.Allowed(epoch, &first, &last);
            test::ForEachCut(run.log, epoch, limits, &random, [&](const Cut& cut) {
                states += 1;
                OverlayDevice state(stable.get());
                test::ApplyCut(cut, &state);
                const std::vector<u8> bytes = test::BytesOf(&state);
                const std::vector<u8> essence = test::Essence(bytes, run.Place());
                const bool isKnown =
                    essence == run.marks[first].essence || essence == run.marks[last].essence;
                Problem problem;
                auto volume = test::MountOn(&state, test::Writing(), &problem);
                if ((Be32(bytes.data() + kHeaderOffset + 4) & kVolUnmounted) != 0) {
                    ASSERT_NE(nullptr, volume) << problem.Text();
                    ASSERT_TRUE(isKnown) << test::CutOperationName(operation);
                } else {
                    unclean += 1;
                    mixed += isKnown ? 0 : 1;
                    ASSERT_EQ(nullptr, volume);
                    ASSERT_EQ("the volume was not unmounted cleanly", problem.what);
                    ASSERT_NE(nullptr, test::MountOn(&state, OpenOptions{}, &problem));
                }
            });
            ASSERT_FALSE(HasFailure());
            test::ApplyEpoch(run.log, epoch, stable.get());
        }
    }
    EXPECT_GT(states, 200u);
    EXPECT_GT(unclean, 100u);
    EXPECT_GT(mixed, 50u);
}

}  // namespace
}  // namespace VELK
