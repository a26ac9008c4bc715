// What of a volume is kept, and how it is made unreadable.
#include "tool/meta_dump.h"

#include <algorithm>
#include <cstring>

#include "hfs/names_text.h"
#include "hfs/records/key_layout.h"
#include "hfs/records/thread_view.h"
#include "hfs/volume/volume_header.h"
#include "tool/catalog_paths.h"
#include "tool/errors.h"

namespace VELK::tool {

namespace {

constexpr u32 kOffsetBytes = 2;
constexpr u32 kHeaderReserved = 56;  // 64 bytes up to the user record
constexpr u32 kPiece = 512;          // nothing of a fork is split finer

bool Equals(const NameUnits& name, const char16_t* text) {
    return name == text;
}

// Names the native system gives to the files and folders it keeps for hard links.
bool IsLinkName(const NameUnits& name) {
    for (const std::u16string_view prefix : {u"iNode", u"temp", u"dir_"}) {
        if (name.starts_with(prefix) && name.size() > prefix.size()) {
            return std::all_of(name.begin() + static_cast<std::ptrdiff_t>(prefix.size()),
                               name.end(),
                               [](char16_t unit) { return unit >= u'0' && unit <= u'9'; });
        }
    }
    return false;
}

// Whether a thread names an item by a name that a key can hold.
bool IsNamed(const ThreadView& thread) {
    return thread.IsValid() && thread.NameLength() <= kCatalogKeys.longestName;
}

// Clears the bits from `bits` on.
void ClearBitsFrom(u64 bits, u8* bytes, u64 size) {
    const u64 whole = std::min(size, bits / 8);
    if (whole < size && bits / 8 == whole && bits % 8 != 0) {
        bytes[whole] &= static_cast<u8>(0xFF00u >> (bits % 8));
        std::memset(bytes + whole + 1, 0, size - whole - 1);
    } else {
        std::memset(bytes + whole, 0, size - whole);
    }
}

}  // namespace

MetaDump::MetaDump(Session* session, const Invocation& call, BlockDevice* target)
    : session_(session),
      call_(call),
      target_(target),
      catalogNames_(session->Tree(kCatalogFileId)->compareKeys == CompareCatKeysCaseIns),
      attributeNames_(false) {}

u64 MetaDump::VolumeBytes(Session* session) {
    const VolumeHeader& header = session->Volume().Header();
    return u64{header.totalBlocks} * header.blockSize;
}

NameMask* MetaDump::MaskOf(u32 fileId) {
    return fileId == kCatalogFileId ? &catalogNames_ : &attributeNames_;
}

void MetaDump::Run() {
    for (const char16_t* name : {u"\0\0\0\0HFS+ Private Data", u".HFS+ Private Directory Data\r"}) {
        const std::u16string_view units(name, name[0] == 0 ? 21 : 29);
        FoundItem folder;
        if (FindItem(session_, CatalogSearchKey(kRootFolderId, units), &folder) &&
            folder.Item().IsValid()) {
            privateFolders_.push_back(folder.Item().Id());
        }
    }
    std::vector<std::pair<u32, std::vector<bool>>> trees;
    for (const u32 fileId : {kCatalogFileId, kExtentsFileId, kAttributesFileId}) {
        if (session_->Volume().HasTree(fileId)) {
            trees.emplace_back(fileId, UsedNodes(fileId));
        }
    }
    for (const auto& [fileId, used] : trees) {
        if (fileId != kExtentsFileId) {
            CollectNames(fileId, used);
            if (!MaskOf(fileId)->Prepare()) {
                ThrowFailed(session_->Image(),
                            "a folder's names hold more different characters than can be replaced",
                            "");
            }
        }
    }
    for (const auto& [fileId, used] : trees) {
        WriteTree(fileId, used);
    }
    WriteBitmap();
    WriteHeaders();
    if (const IoResult result = target_->Sync(); !result.Ok()) {
        ThrowFailed(call_.outputFile, "cannot write: " + IoErrorText(result.error), "");
    }
}

// Index and leaf nodes that the map or the index names.
std::vector<bool> MetaDump::UsedNodes(u32 fileId) {
    CBTreeHfs* tree = session_->Tree(fileId);
    const TreeSurvey survey = SurveyTree(tree, [&] {
        session_->Volume().TrimCache();
        ThrowIfInterrupted();
    });
    std::vector<bool> used(tree->header.totalNodes);
    for (std::size_t i = 0; i < survey.nodes.size() && i < used.size(); ++i) {
        const NodeState state = survey.nodes[i].state;
        used[i] = state == NodeState::kIndex || state == NodeState::kLeaf;
    }
    VisitNodes(session_, fileId, NodeOrder::kDepth, call_.keepGoing, [&](const HeldNode& node) {
        used[node.Number()] = node.Kind() == kBTIndexNode || node.Kind() == kBTLeafNode;
        return true;
    });
    return used;
}

void MetaDump::Damaged(u32 fileId, u32 node, int status, u32 record) {
    const Problem problem =
        session_->ProblemOf(fileId, node, status != kOk ? status : kErrCorrupt,
                            "record " + std::to_string(record) + " cannot be read");
    if (!call_.keepGoing) {
        ThrowProblem(session_->Image(), problem);
    }
    session_->NotePassedOver(problem);
}

bool MetaDump::StaysAsItIs(u32 parent, const u8* unitsBe, u32 count) const {
    const NameUnits name = UnitsFromStored(unitsBe, count);
    if (parent == kRootFolderId) {
        return IsPrivateFolderName(parent, unitsBe, count) || Equals(name, u".journal") ||
               Equals(name, u".journal_info_block");
    }
    return std::find(privateFolders_.begin(), privateFolders_.end(), parent) !=
               privateFolders_.end() &&
           IsLinkName(name);
}

void MetaDump::AddNames(u32 fileId, const NodeRecord& record, bool isLeaf) {
    SearchKey key;
    if (!SearchKeyFromStored(fileId, record.key, record.keySize, &key)) {
        return;
    }
    const KeyView view(fileId, record.key);
    if (fileId == kAttributesFileId) {
        attributeNames_.Add(key.id, view.Name(), view.NameLength(), false);
        return;
    }
    const auto add = [&](u32 parent, const u8* units, u32 count) {
        catalogNames_.Add(parent, units, count, StaysAsItIs(parent, units, count));
    };
    add(key.id, view.Name(), view.NameLength());
    const ThreadView thread(record.data, record.dataSize);
    if (isLeaf && IsNamed(thread)) {
        add(thread.Parent(), thread.Name(), thread.NameLength());
    }
}

void MetaDump::CollectNames(u32 fileId, const std::vector<bool>& used) {
    CBTreeHfs* tree = session_->Tree(fileId);
    Progress progress(call_, std::string("names ") + ForkName(fileId), "nodes", used.size(), 0);
    RecordReader reader(tree);
    HeldNode node(tree);
    NodeRecord record;
    for (u32 number = 0; number < used.size(); ++number) {
        progress.Update(number);
        if (!used[number] || node.Open(number) != kOk) {
            continue;
        }
        for (u32 i = 0; i < node.RecordCount(); ++i) {
            if (reader.Describe(node.Get(), i, &record) == kOk) {
                AddNames(fileId, record, node.Kind() == kBTLeafNode);
            }
        }
    }
}

// Keeps what the kind of record says and takes out the rest: values of attributes, bytes of kinds
// nobody knows. The name of a thread is masked.
void MetaDump::CleanData(u32 fileId, u8* data, u32 size) {
    const ThreadView thread(data, size);
    if (fileId == kCatalogFileId && IsNamed(thread)) {
        catalogNames_.Replace(thread.Parent(), data + kThreadFixed, thread.NameLength());
        std::memset(data + thread.Size(), 0, size - thread.Size());
        return;
    }
    const RecordKind* kind = KindOfRecord(fileId, data, size);
    const u32 kept = kind != nullptr ? kind->size : fileId == kCatalogFileId ? 2u : 4u;
    if (kept < size) {
        std::memset(data + kept, 0, size - kept);
    }
}

void MetaDump::CleanRecord(u32 fileId, bool isLeaf, const NodeRecord& record, u8* bytes) {
    u8* key = bytes + record.offset;
    u8* data = key + record.size - record.dataSize;
    const KeyView view(fileId, key);
    const u32 keyEnd = view.Size();
    if (fileId != kExtentsFileId) {
        u8* name = key + keyEnd - 2 * view.NameLength();
        MaskOf(fileId)->Replace(view.Id(), name, view.NameLength());
    }
    if (key + keyEnd < data) {
        std::memset(key + keyEnd, 0, static_cast<std::size_t>(data - key) - keyEnd);
    }
    if (isLeaf) {
        CleanData(fileId, data, record.dataSize);
    } else if (record.dataSize > kChildSize) {
        std::memset(data + kChildSize, 0, record.dataSize - kChildSize);
    }
}

// Puts descriptor, records and offsets of a node into `bytes`, which are zero.
void MetaDump::CleanNode(u32 fileId, const HeldNode& node, u8* bytes) {
    CBTreeHfs* tree = session_->Tree(fileId);
    const u32 nodeSize = tree->header.nodeSize;
    const u32 count = node.RecordCount();
    const u32 table = std::min(nodeSize - kDescSize, kOffsetBytes * (count + 1));
    node.Bytes().CopyOut(bytes, 0, kDescSize);
    node.Bytes().CopyOut(bytes + nodeSize - table, nodeSize - table, table);
    RecordReader reader(tree);
    NodeRecord record;
    SearchKey key;
    for (u32 i = 0; i < count; ++i) {
        const int status = reader.Describe(node.Get(), i, &record);
        if (status != kOk || record.offset + record.size > nodeSize - table ||
            !SearchKeyFromStored(fileId, record.key, record.keySize, &key)) {
            Damaged(fileId, node.Number(), status, i);
            continue;
        }
        node.Bytes().CopyOut(bytes + record.offset, record.offset, record.size);
        CleanRecord(fileId, node.Kind() == kBTLeafNode, record, bytes);
    }
}

void MetaDump::WriteTree(u32 fileId, const std::vector<bool>& used) {
    CBTreeHfs* tree = session_->Tree(fileId);
    const u32 nodeSize = tree->header.nodeSize;
    std::vector<u8> bytes(nodeSize);
    HeldNode node(tree);
    Progress progress(call_, std::string("metadump ") + ForkName(fileId), "nodes", used.size(),
                      nodeSize);
    // The map: the bits that stand for nodes, in the header node and the map nodes.
    u64 bit = 0;
    std::vector<u32> holders = MapNodes(tree);
    holders.insert(holders.begin(), 0);
    for (const u32 number : holders) {
        const u32 start = number == 0 ? kHeadMapRecord : kDescSize;
        const u32 mapBytes = nodeSize - (number == 0 ? kHeadMapOverhead : kMapNodeOverhead);
        if (const int status = node.Open(number); status != kOk) {
            Damaged(fileId, number, status, 0);
            continue;
        }
        node.Bytes().CopyOut(bytes.data(), 0, nodeSize);
        if (number == 0) {
            std::memset(bytes.data() + kHeaderReserved, 0, kHeadMapRecord - kHeaderReserved);
        }
        const u64 bits = std::max<u64>(tree->header.totalNodes, bit) - bit;
        ClearBitsFrom(bits, bytes.data() + start, mapBytes);
        const u32 behind = nodeSize - (number == 0 ? 4 : 2) * kOffsetBytes;
        std::memset(bytes.data() + start + mapBytes, 0, behind - start - mapBytes);
        bit += u64{8} * mapBytes;
        WriteFork(fileId, u64{number} * nodeSize, bytes.data(), nodeSize);
    }
    for (u32 number = 1; number < used.size(); ++number) {
        progress.Update(number);
        if (!used[number]) {
            continue;
        }
        if (const int status = node.Open(number); status != kOk) {
            Damaged(fileId, number, status, 0);
            continue;
        }
        std::fill(bytes.begin(), bytes.end(), u8{0});
        CleanNode(fileId, node, bytes.data());
        WriteFork(fileId, u64{number} * nodeSize, bytes.data(), nodeSize);
        nodes_ += 1;
    }
}

void MetaDump::WriteFork(u32 fileId, u64 forkOffset, const u8* bytes, u32 size) {
    for (u32 at = 0; at < size; at += kPiece) {
        const std::optional<u64> offset = session_->Volume().ImageOffset(fileId, forkOffset + at);
        if (offset) {
            Write(*offset - session_->Volume().Place().offset, bytes + at,
                  std::min(kPiece, size - at));
        }
    }
}

void MetaDump::WriteBitmap() {
    ImageVolume& volume = session_->Volume();
    const u64 blocks = volume.Header().totalBlocks;
    const u64 size = std::min(volume.ForkBytes(kAllocationFileId), (blocks + 7) / 8);
    std::vector<u8> bytes(std::size_t{1} << 16);
    for (u64 at = 0; at < size; at += bytes.size()) {
        const u32 piece = static_cast<u32>(std::min<u64>(bytes.size(), size - at));
        std::fill(bytes.begin(), bytes.end(), u8{0});
        if (volume.ReadFork(kAllocationFileId, at, bytes.data(), piece) != kOk) {
            ThrowProblem(session_->Image(), volume.LastIoProblem());
        }
        ClearBitsFrom(blocks - at * 8, bytes.data(), piece);
        WriteFork(kAllocationFileId, at, bytes.data(), (piece + kPiece - 1) / kPiece * kPiece);
    }
}

// Both headers, as far apart as they were. Without the journal, and without the number that tells
// one volume from all others.
void MetaDump::WriteHeaders() {
    const auto write = [&](VolumeHeader header, u64 offset) {
        u8 bytes[kHeaderSize];
        header.attributes &= ~kVolJournaled;
        header.journalInfoBlock = 0;
        header.finderInfo[6] = 0;
        header.finderInfo[7] = 0;
        EncodeHeader(header, bytes);
        Write(offset, bytes, kHeaderSize);
    };
    const VolumeHeader& header = session_->Volume().Header();
    const VolumeHeader* alternate = session_->Volume().AlternateHeader(nullptr);
    write(header, kHeaderOffset);
    write(alternate != nullptr ? *alternate : header, VolumeBytes(session_) - kAltHeaderFromEnd);
}

void MetaDump::Write(u64 offset, const u8* bytes, u32 size) {
    // Zeros stay holes in the file.
    if (std::all_of(bytes, bytes + size, [](u8 byte) { return byte == 0; })) {
        return;
    }
    const IoResult result = target_->Write(offset, bytes, size);
    if (!result.Ok()) {
        ThrowFailed(call_.outputFile, "cannot write: " + IoErrorText(result.error), "");
    }
    bytes_ += size;
}

}  // namespace VELK::tool
