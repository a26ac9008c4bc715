// The volume in words.
#include "tool/volume_text.h"

#include <algorithm>

#include "hfs/records/text_format.h"
#include "tool/catalog_paths.h"
#include "tool/errors.h"
#include "tool/hex_rows.h"

namespace VELK::tool {

namespace {

// Name of the root folder; empty when it cannot be read.
FoundItem RootFolder(Session* session) {
    FoundItem root;
    Problem problem;
    if (session->TryTree(kCatalogFileId, &problem) == nullptr) {
        return root;
    }
    try {
        if (!FindItemById(session, kRootFolderId, &root)) {
            return {};
        }
    } catch (const ToolError&) {
        return {};
    }
    return root;
}

std::string PlaceText(const VolumePlace& place) {
    std::string text;
    if (place.partition != 0) {
        text += fmt::format(" in partition {} of {} ({})", place.partition, place.partitions,
                            SchemeName(place.scheme));
    }
    if (place.wrapped) {
        text += fmt::format("{} inside an HFS volume", text.empty() ? "" : ",");
    }
    if (place.offset != 0) {
        text += fmt::format("{} offset {}", text.empty() ? " at" : ",", Grouped(place.offset));
        if (place.offset % kSectorSize == 0) {
            text += fmt::format(" ({}s)", place.offset / kSectorSize);
        }
    }
    return text;
}

std::string JournalText(const JournalState& journal) {
    if (!journal.present) {
        return "no journal";
    }
    if (!journal.readable) {
        return "journal unreadable" + (journal.text.empty() ? "" : " (" + journal.text + ")");
    }
    return journal.empty ? "journal empty"
                         : "journal holds " + Grouped(journal.pendingBytes) + " B";
}

const char* UnmountText(const VolumeHeader& header) {
    const bool clean =
        (header.attributes & kVolUnmounted) != 0 && (header.attributes & kVolBootInconsistent) == 0;
    return clean ? "unmounted cleanly" : "not unmounted cleanly";
}

std::string BackupText(Session* session) {
    ImageVolume& volume = session->Volume();
    const VolumeHeader* other = volume.AlternateHeader(nullptr);
    if (volume.UsedBackupHeader()) {
        return "read through the backup header";
    }
    if (other == nullptr) {
        return "no backup header";
    }
    const std::string differences = HeaderDifferences(volume.Header(), *other);
    return differences.empty() ? "backup header agrees" : "backup header differs: " + differences;
}

bool NamesAreBinary(Session* session) {
    Problem problem;
    const CBTreeHfs* tree = session->TryTree(kCatalogFileId, &problem);
    return tree != nullptr && tree->compareKeys == CompareCatKeysCaseBin;
}

void ForkMember(const char* name, const HfsFork& fork, JsonWriter* json) {
    json->Key(name);
    json->BeginObject();
    json->Member("size", fork.logicalSize);
    json->Member("blocks", fork.totalBlocks);
    json->Member("clump", fork.clumpSize);
    json->EndObject();
}

}  // namespace

std::string VolumeText(Session* session) {
    const VolumeHeader& header = session->Volume().Header();
    const FoundItem root = RootFolder(session);
    const std::string name = root.data.empty()
                                 ? "without a readable name"
                                 : "\"" + NameText(root.name.data(), root.NameLength()) + "\"";
    std::string text = fmt::format("{}: {} volume {}{}\n", EscapedText(session->Image()),
                                   header.IsHfsx() ? "HFSX" : "HFS Plus", name,
                                   PlaceText(session->Volume().Place()));
    std::string created = DateText(header.createDate);
    if (header.createDate != 0) {
        created.back() = ' ';  // the one date of a volume that is in local time
        created += "local time";
    }
    text += fmt::format(
        "version {}, created {}, {}, {}{}\n", header.version, created, UnmountText(header),
        JournalText(session->Volume().Journal()),
        (header.attributes & kVolSoftwareLock) != 0 ? ", write-protected by software" : "");
    text += fmt::format("blocks {} B x {}, free {}; {}, {}, next ID {}; {}\n",
                        Grouped(header.blockSize), Grouped(header.totalBlocks),
                        Grouped(header.freeBlocks), Counted(header.fileCount, "file", "files"),
                        Counted(header.folderCount, "folder", "folders"),
                        Grouped(header.nextCatalogId), BackupText(session));
    text += fmt::format("names: {} (version {})\n",
                        NamesAreBinary(session) ? "case-sensitive" : "case-insensitive",
                        header.version);
    return text;
}

void VolumeMembers(Session* session, JsonWriter* json) {
    ImageVolume& volume = session->Volume();
    const VolumeHeader& header = volume.Header();
    const VolumePlace& place = volume.Place();
    const FoundItem root = RootFolder(session);
    json->Member("kind", header.IsHfsx() ? "HFSX" : "HFS+");
    json->Key("name");
    if (root.data.empty()) {
        json->Null();
    } else {
        std::string name;
        AppendJsonUnits(&name, root.name.data(), root.NameLength());
        json->EscapedString(name);
    }
    json->Member("offset", place.offset);
    json->Member("partition", place.partition);
    json->Member("scheme", SchemeName(place.scheme));
    json->Member("wrapped", place.wrapped);
    json->Member("version", header.version);
    json->Member("attributes", header.attributes);
    std::string created = DateIso(header.createDate);
    created.resize(std::min(created.find('Z'), created.size()));  // in local time: without a zone
    json->Member("created_local", created);
    json->Member("modified", DateIso(header.modifyDate));
    json->Member("unmounted_cleanly", UnmountText(header)[0] == 'u');
    const JournalState& journal = volume.Journal();
    json->Member("journal", !journal.present    ? "none"
                            : !journal.readable ? "unreadable"
                            : journal.empty     ? "empty"
                                                : "pending");
    json->Member("journal_pending_bytes", journal.pendingBytes);
    json->Member("write_protected", (header.attributes & kVolSoftwareLock) != 0);
    json->Member("block_size", header.blockSize);
    json->Member("blocks", header.totalBlocks);
    json->Member("free_blocks", header.freeBlocks);
    json->Member("files", header.fileCount);
    json->Member("folders", header.folderCount);
    json->Member("next_id", header.nextCatalogId);
    json->Member("case_sensitive", NamesAreBinary(session));
    json->Member("truncated", volume.IsTruncated());
    ForkMember("allocation", header.allocationFile, json);
    json->Key("notes");
    json->BeginArray();
    for (const Problem& note : volume.Notes()) {
        json->Value(note.Text());
    }
    json->EndArray();
}

void PrintPartitions(Invocation* call) {
    Problem problem;
    const auto device = FileDevice::Open(call->image, FileDevice::Mode::kRead, 0, &problem);
    if (!device) {
        ThrowProblem(call->image, problem);
    }
    VolumeScan scan;
    PlaceOptions options;
    options.offset = call->offset;
    options.partition = call->partition;
    problem = LocateVolume(device.get(), options, &scan);
    if (call->json) {
        std::string text;
        JsonWriter json(&text);
        json.BeginObject();
        json.Member("schema", "treehfs.info.partitions/1");
        json.Member("scheme", SchemeName(scan.scheme));
        json.Key("partitions");
        json.BeginArray();
        for (const PartitionEntry& entry : scan.partitions) {
            json.BeginObject();
            json.Member("number", entry.number);
            json.Member("offset", entry.offset);
            json.Member("size", entry.size);
            json.Member("type", entry.type);
            json.Member("name", entry.name);
            json.Member("content", entry.contentName);
            json.Member("taken", entry.taken);
            json.Member("reason", entry.reason);
            json.EndObject();
        }
        json.EndArray();
        json.EndObject();
        call->out.Write(text + "\n");
        return;
    }
    if (scan.partitions.empty()) {
        call->out.Print(
            "{}: no partition map; {}\n", EscapedText(call->image),
            problem ? problem.what : "the volume starts at byte " + Grouped(scan.place.offset));
        return;
    }
    call->out.Print("{}: {} with {}\n\n", EscapedText(call->image), SchemeName(scan.scheme),
                    Counted(scan.partitions.size(), "partition", "partitions"));
    call->out.Write(" no           offset             size  type                      remark\n");
    for (const PartitionEntry& entry : scan.partitions) {
        call->out.Print("{:>3}{:>17}{:>15} B  {:<24}  {}\n", entry.number, Grouped(entry.offset),
                        Grouped(entry.size), EscapedText(entry.type), EscapedText(entry.reason));
    }
    if (problem) {
        call->out.Print("\n{}\n", EscapedText(problem.Text()));
    }
}

void PrintHeaders(Session* session, Invocation* call) {
    ImageVolume& volume = session->Volume();
    u8 bytes[kHeaderSize];
    EncodeHeader(volume.Header(), bytes);
    call->out.Print("volume header at image offset {}\n",
                    HexOffset(volume.Place().offset + kHeaderOffset));
    WriteHexRows(&call->out, bytes, sizeof bytes, 0);
    for (const u32 fileId : call->trees) {
        u8 record[kHeadEnd - kHeadTreeDepth];
        if (!volume.HasTree(fileId)) {
            continue;
        }
        const int status = volume.ReadFork(fileId, kHeadTreeDepth, record, sizeof record);
        if (status != 0) {
            ThrowProblem(session->Image(), session->ProblemOf(fileId, 0, status, "header record"));
        }
        const std::string place = session->OffsetText(fileId, kHeadTreeDepth);
        call->out.Print("\n{} header record{}\n", ForkName(fileId),
                        place.empty() ? "" : " at " + place);
        WriteHexRows(&call->out, record, sizeof record, kHeadTreeDepth);
    }
}

}  // namespace VELK::tool
