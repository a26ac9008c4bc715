// Lines and JSON of catalog items.
#include "tool/item_printer.h"

#include <algorithm>
#include <cstring>

#include "hfs/names_text.h"
#include "hfs/records/key_layout.h"
#include "hfs/records/record_view.h"
#include "hfs/records/text_format.h"

namespace VELK::tool {

namespace {

constexpr u32 kForkTotalBlocks = 12;
constexpr u32 kForkExtents = 16;
constexpr u32 kTypeWidth = 8;
constexpr u32 kSizeWidth = 10;

u64 AppendRuns(const u8* extents, std::vector<HfsExtent>* runs) {
    u64 blocks = 0;
    for (u32 i = 0; i < kExtentCount; ++i) {
        const HfsExtent extent = {GetBe32(extents + 8 * i), GetBe32(extents + 8 * i + 4)};
        if (extent.blockCount == 0) {
            break;
        }
        runs->push_back(extent);
        blocks += extent.blockCount;
    }
    return blocks;
}

std::string RunsText(const std::vector<HfsExtent>& runs) {
    std::string text;
    for (const HfsExtent& run : runs) {
        text += fmt::format(" [{},{}]", run.startBlock, run.blockCount);
    }
    return text;
}

std::string ComposedText(const std::string& text) {
    NameUnits units;
    return VELK::UnitsFromUtf8(text, &units) ? Utf8FromUnits(ComposedUnits(units)) : text;
}

}  // namespace

std::vector<HfsExtent> ForkRuns(Session* session, u32 fileId, u8 forkType, const u8* fork) {
    std::vector<HfsExtent> runs;
    const u64 wanted = GetBe32(fork + kForkTotalBlocks);
    u64 blocks = AppendRuns(fork + kForkExtents, &runs);
    if (blocks >= wanted || runs.size() < kExtentCount) {
        return runs;
    }
    LeafCursor cursor(session, kExtentsFileId, false);
    cursor.Seek(ExtentsSearchKey(fileId, forkType, static_cast<u32>(blocks)), nullptr);
    LeafRecord record;
    while (blocks < wanted && cursor.Next(&record) && record.dataSize >= kExtentRecordSize &&
           KeyView(kExtentsFileId, record.key).Id() == fileId &&
           record.key[kExtKeyForkType] == forkType) {
        blocks += AppendRuns(record.data, &runs);
    }
    return runs;
}

ItemPrinter::ItemPrinter(Session* session, Output* out, const PrintStyle& style)
    : session_(session), out_(out), style_(style) {
    // The next ID is above every ID, so the column of IDs is as wide as it needs to be.
    idWidth_ = std::max(5u, DigitCount(session->Volume().Header().nextCatalogId));
}

NameForm ItemPrinter::Form() const {
    const bool isRaw = style_.zeroEnds || (style_.format && style_.format->WantsRawNames());
    return style_.json ? NameForm::kJson : isRaw ? NameForm::kRaw : NameForm::kText;
}

void ItemPrinter::PutPath(const ListedItem& listed, std::string* text) const {
    text->clear();
    if (style_.wholePaths || style_.json || style_.format) {
        *text = *listed.folderPath;
    }
    AppendName(text, listed.name, listed.nameLength, Form());
    if (style_.composed) {
        *text = ComposedText(*text);
    }
}

void ItemPrinter::Print(const ListedItem& listed) {
    if (style_.json) {
        PrintJson(listed);
        return;
    }
    if (style_.format) {
        PutPath(listed, &text_);
        std::string line;
        style_.format->Append(listed, text_, &line);
        out_->Write(line);
        return;
    }
    if (style_.longForm) {
        PrintLong(listed);
    } else {
        PrintBare(listed);
    }
    if (style_.extents) {
        PrintExtents(listed.item);
    }
    if (style_.attributes) {
        PrintAttributes(listed.item);
    }
}

void ItemPrinter::PrintBare(const ListedItem& listed) {
    const char end = style_.zeroEnds ? '\0' : '\n';
    if (style_.composed) {
        PutPath(listed, &text_);
        text_.push_back(end);
        out_->Write(text_);
        return;
    }
    const std::string& folder = *listed.folderPath;
    const std::size_t most = std::size_t{listed.nameLength} * kNameBytesPerUnit + 1;
    if (style_.wholePaths) {
        out_->Write(folder);
    }
    char* at = out_->Room(most);
    at = PutName(at, listed.name, listed.nameLength, Form());
    *at++ = end;
    out_->Used(at);
}

void ItemPrinter::PrintLong(const ListedItem& listed) {
    char columns[kTypeWidth + 1 + 20 + 1 + 20 + 2 + kDateWidth + 2];
    const char* type = ItemKindName(listed.item.Kind());
    std::fill_n(columns, kTypeWidth, ' ');
    std::copy_n(type, std::strlen(type), columns);
    char* at = columns + kTypeWidth;
    at = PutNumber(at, listed.item.Id(), idWidth_);
    *at++ = ' ';
    at = PutNumber(at, listed.item.Size(), kSizeWidth);
    *at++ = ' ';
    *at++ = ' ';
    at = PutDate(at, listed.item.ModifyDate());
    *at++ = ' ';
    *at++ = ' ';
    out_->Write({columns, static_cast<std::size_t>(at - columns)});
    PrintBare(listed);
}

void ItemPrinter::PrintExtents(const CatalogItem& item) {
    if (item.IsFolder()) {
        return;
    }
    const std::vector<HfsExtent> data = ForkRuns(session_, item.Id(), kForkData, item.DataFork());
    if (!data.empty()) {
        out_->Print("    data{}\n", RunsText(data));
    }
    const std::vector<HfsExtent> rsrc =
        ForkRuns(session_, item.Id(), kForkResource, item.ResourceFork());
    if (!rsrc.empty()) {
        out_->Print("    rsrc{}  {} B\n", RunsText(rsrc), Grouped(item.ResourceSize()));
    }
}

void ItemPrinter::PrintAttributes(const CatalogItem& item) {
    if (!session_->Volume().HasTree(kAttributesFileId)) {
        return;
    }
    LeafCursor cursor(session_, kAttributesFileId, false);
    cursor.Seek(LowestKey(kAttributesFileId, item.Id()), nullptr);
    LeafRecord record;
    while (cursor.Next(&record)) {
        const KeyView key(kAttributesFileId, record.key);
        if (key.Id() != item.Id()) {
            break;
        }
        out_->Print("    {}  {}\n", NameText(key.Name(), key.NameLength()),
                    EscapedText(RecordSummary(kAttributesFileId, record.data, record.dataSize)));
    }
}

void ItemPrinter::PrintJson(const ListedItem& listed) {
    const CatalogItem& item = listed.item;
    std::string line;
    JsonWriter json(&line);
    PutPath(listed, &text_);
    json.BeginObject();
    json.Key("path");
    json.EscapedString(text_);
    text_.clear();
    AppendJsonUnits(&text_, listed.name, listed.nameLength);
    json.Key("name");
    json.EscapedString(text_);
    json.Member("type", ItemKindName(item.Kind()));
    json.Member("id", item.Id());
    json.Member("parent", listed.parent);
    json.Member(item.IsFolder() ? "entries" : "size", item.Size());
    if (item.ResourceSize() != 0) {
        json.Member("resource_size", item.ResourceSize());
    }
    if (item.ModifyDate() != 0) {
        json.Member("modified", DateIso(item.ModifyDate()));
    }
    if (listed.isLost) {
        json.Member("lost", true);
    }
    if (style_.extents && !item.IsFolder()) {
        for (const u8 forkType : {kForkData, kForkResource}) {
            const u8* fork = forkType == kForkData ? item.DataFork() : item.ResourceFork();
            json.Key(forkType == kForkData ? "data" : "rsrc");
            json.BeginArray();
            for (const HfsExtent& run : ForkRuns(session_, item.Id(), forkType, fork)) {
                json.BeginArray();
                json.Value(run.startBlock);
                json.Value(run.blockCount);
                json.EndArray();
            }
            json.EndArray();
        }
    }
    if (style_.attributes && session_->Volume().HasTree(kAttributesFileId)) {
        json.Key("attributes");
        json.BeginArray();
        LeafCursor cursor(session_, kAttributesFileId, false);
        cursor.Seek(LowestKey(kAttributesFileId, item.Id()), nullptr);
        LeafRecord record;
        while (cursor.Next(&record) && KeyView(kAttributesFileId, record.key).Id() == item.Id()) {
            json.BeginObject();
            KeyMembers(kAttributesFileId, record.key, record.keySize, &json);
            RecordMembers(kAttributesFileId, record.data, record.dataSize, &json);
            json.EndObject();
        }
        json.EndArray();
    }
    json.EndObject();
    line.push_back('\n');
    out_->Write(line);
}

}  // namespace VELK::tool
