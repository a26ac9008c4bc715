// Reading record data: bytes by recipe, or a readable record field by field.
#include "hfs/records/record_text.h"

#include <cstdio>
#include <memory>

#include "hfs/records/key_layout.h"
#include "hfs/records/key_text.h"
#include "hfs/records/nearest_word.h"
#include "hfs/records/record_fields.h"
#include "hfs/records/text_format.h"
#include "hfs/treehfs/bytes.h"

namespace VELK {
namespace {

Problem DataProblem(std::string_view text, const std::string& what) {
    const std::string shown =
        text.size() <= 60 ? std::string(text) : std::string(text.substr(0, 57)) + "...";
    return UsageProblem("data '" + shown + "': " + what, "");
}

Problem ReadWholeFile(std::string_view text, std::vector<u8>* bytes) {
    const std::string path(text.substr(1));
    const bool isInput = path == "-";
    std::FILE* file = isInput ? stdin : std::fopen(path.c_str(), "rb");
    if (file == nullptr) {
        return DataProblem(text, "cannot open the file");
    }
    bytes->resize(kMostRecordBytes + 1);
    const std::size_t count = std::fread(bytes->data(), 1, bytes->size(), file);
    const bool failed = std::ferror(file) != 0;
    if (!isInput) {
        std::fclose(file);
    }
    bytes->resize(count);
    if (failed) {
        return DataProblem(text, "read error");
    }
    if (count > kMostRecordBytes) {
        return DataProblem(text, "more than " + Grouped(kMostRecordBytes) + " bytes");
    }
    return {};
}

Problem SizeProblem(std::string_view text, std::string_view count) {
    return DataProblem(text, "'" + std::string(count) + "' is no number of bytes from 0 to " +
                                 std::to_string(kMostRecordBytes));
}

Problem ReadFill(std::string_view text, std::vector<u8>* bytes) {
    const std::string_view body = text.substr(5);
    const std::size_t star = body.find('*');
    if (star == std::string_view::npos) {
        return DataProblem(text, "expected fill:XX*COUNT, for example fill:aa*248");
    }
    std::vector<u8> pattern;
    const Problem problem = ParseHexBytes(body.substr(0, star), text, &pattern);
    if (problem) {
        return problem;
    }
    u64 count = 0;
    if (!ParseNumber(body.substr(star + 1), kMostRecordBytes, &count)) {
        return SizeProblem(text, body.substr(star + 1));
    }
    if (pattern.empty() || count * pattern.size() > kMostRecordBytes) {
        return DataProblem(text, "expected fill:XX*COUNT, for example fill:aa*248");
    }
    bytes->clear();
    for (; count > 0; --count) {
        bytes->insert(bytes->end(), pattern.begin(), pattern.end());
    }
    return {};
}

Problem ReadCounted(std::string_view text, std::vector<u8>* bytes) {
    const bool isSequence = text.starts_with("seq:");
    const std::string_view number = text.substr(isSequence ? 4 : 5);
    u64 count = 0;
    if (!ParseNumber(number, kMostRecordBytes, &count)) {
        return SizeProblem(text, number);
    }
    bytes->assign(count, 0);
    for (std::size_t i = 0; isSequence && i < count; ++i) {
        (*bytes)[i] = static_cast<u8>(i);
    }
    return {};
}

// Reads a readable record character by character.
class RecordReader {
public:
    RecordReader(std::string_view text, u32 fileId) : text_(text), fileId_(fileId) {}

    Problem Read(std::vector<u8>* stored) {
        const std::size_t brace = text_.find('{');
        const std::string_view name = text_.substr(0, brace);
        const RecordKind* kind = KindByName(name, fileId_);
        if (kind == nullptr) {
            std::vector<std::string> names;
            for (u32 i = 0; i < kRecordKindCount; ++i) {
                names.push_back(kRecordKinds[i].name);
            }
            const std::string word(name);
            return Fault("unknown record '" + word + "'" + DidYouMean(word, names));
        }
        if (kind->fileId != fileId_) {
            return Fault("a record of the " + std::string(ForkName(kind->fileId)) +
                         " tree, the tree is " + ForkName(fileId_));
        }
        kind_ = kind;
        at_ = brace + 1;
        record_.assign(kind->size, 0);
        if (kind->fileId == kCatalogFileId) {
            PutBe16(record_.data(), kind->type);
        } else if (kind->fileId == kAttributesFileId) {
            PutBe32(record_.data(), kind->type);
        }
        const Problem problem = kind->type == kInlineAttribute                ? ReadInline()
                                : kind->fields[0].kind == FieldKind::kExtents ? ReadBareExtents()
                                                                              : ReadFields();
        if (!problem) {
            *stored = std::move(record_);
        }
        return problem;
    }

private:
    Problem Fault(const std::string& what) const { return DataProblem(text_, what); }
    Problem Expected(const std::string& what) const {
        return Fault("expected " + what + " at character " + std::to_string(at_ + 1));
    }

    void SkipBlanks() {
        while (at_ < text_.size() && (text_[at_] == ' ' || text_[at_] == '\t')) {
            ++at_;
        }
    }
    bool Take(char wanted) {
        SkipBlanks();
        if (at_ >= text_.size() || text_[at_] != wanted) {
            return false;
        }
        ++at_;
        return true;
    }
    // The characters up to the next comma, bracket, brace or blank.
    std::string_view TakeWord() {
        SkipBlanks();
        const std::size_t end = std::min(text_.find_first_of(",]}[ \t", at_), text_.size());
        const std::string_view word = text_.substr(at_, end - at_);
        at_ = end;
        return word;
    }

    Problem TakeEnd() {
        if (!Take('}')) {
            return Expected("',' or '}'");
        }
        return at_ == text_.size() ? Problem{} : Expected("nothing more");
    }

    Problem ReadInline() {
        SkipBlanks();
        std::vector<u8> value;
        if (text_.substr(at_).starts_with("hex:")) {
            const std::size_t end = std::min(text_.find('}', at_), text_.size());
            const Problem problem =
                ParseHexBytes(text_.substr(at_ + 4, end - at_ - 4), text_, &value);
            if (problem) {
                return problem;
            }
            at_ = end;
        } else {
            NameUnits units;
            if (!TakeQuoted(text_, &at_, Typed::kAsIs, &units)) {
                return Expected("a string in double quotes or hex:");
            }
            const std::string bytes = Utf8FromUnits(units);
            value.assign(bytes.begin(), bytes.end());
        }
        PutBe32(record_.data() + 12, static_cast<u32>(value.size()));
        record_.insert(record_.end(), value.begin(), value.end());
        record_.resize(RoundUpEven(static_cast<u32>(record_.size())));
        return TakeEnd();
    }

    Problem ReadBareExtents() {
        if (!Take('[')) {
            return Expected("'['");
        }
        const Problem problem = ReadExtentsList(record_.data() + kind_->fields[0].offset);
        return problem ? problem : TakeEnd();
    }

    // [[start,count],...] behind its first bracket.
    Problem ReadExtentsList(u8* extents) {
        for (u32 i = 0; !Take(']'); ++i) {
            if (i == kExtentCount) {
                return Fault("more than " + std::to_string(kExtentCount) + " extents");
            }
            u64 start = 0;
            u64 count = 0;
            if ((i != 0 && !Take(',')) || !Take('[') || !ParseNumber(TakeWord(), ~0u, &start) ||
                !Take(',') || !ParseNumber(TakeWord(), ~0u, &count) || !Take(']')) {
                return Expected("extents as [[start,count],...]");
            }
            PutBe32(extents + 8 * i, static_cast<u32>(start));
            PutBe32(extents + 8 * i + 4, static_cast<u32>(count));
        }
        return {};
    }

    Problem ReadFields() {
        bool isFirst = true;
        while (!Take('}')) {
            if (!isFirst && !Take(',')) {
                return Expected("',' or '}'");
            }
            isFirst = false;
            SkipBlanks();
            const std::size_t colon = text_.find(':', at_);
            if (colon == std::string_view::npos) {
                return Expected("FIELD:VALUE");
            }
            const std::string_view name = text_.substr(at_, colon - at_);
            at_ = colon + 1;
            const Problem problem = ReadField(name);
            if (problem) {
                return problem;
            }
        }
        if (at_ != text_.size()) {
            return Expected("nothing more");
        }
        SumBlocks();
        record_.insert(record_.end(), threadName_.begin(), threadName_.end());
        return {};
    }

    Problem ReadField(std::string_view name) {
        if (kind_->size == kThreadFixed && name == "name") {
            return ReadThreadName();
        }
        const Field* field = FieldByName(*kind_, name);
        if (field == nullptr) {
            std::vector<std::string> names;
            for (u32 i = 0; i < kind_->fieldCount; ++i) {
                names.push_back(kind_->fields[i].name);
            }
            const std::string word(name);
            return Fault("unknown field '" + word + "'" + DidYouMean(word, names));
        }
        if (field->kind == FieldKind::kExtents) {
            return Take('[') ? ReadExtentsList(record_.data() + field->offset) : Expected("'['");
        }
        u64 value = 0;
        const std::size_t start = at_;
        if (!TakeValue(*field, &value)) {
            at_ = start;
            return Fault("'" + std::string(TakeWord()) + "' is no value for '" + field->name + "'");
        }
        if (field->kind == FieldKind::kBlocks) {
            givenBlocks_ |= u64{1} << (field - kind_->fields);
        }
        PutField(record_.data(), *field, value);
        return {};
    }

    bool TakeValue(const Field& field, u64* value) {
        const u64 most = field.width == 8 ? ~u64{0} : (u64{1} << (8 * field.width)) - 1;
        SkipBlanks();
        if (field.kind == FieldKind::kCode && at_ < text_.size() && text_[at_] == '"') {
            NameUnits code;
            if (!TakeQuoted(text_, &at_, Typed::kAsIs, &code) || code.size() != 4) {
                return false;
            }
            for (const char16_t unit : code) {
                if (unit > 0xFF) {
                    return false;
                }
                *value = *value << 8 | unit;
            }
            return true;
        }
        const std::string_view word = TakeWord();
        if (field.kind == FieldKind::kOctal && word.size() > 1 && word[0] == '0' &&
            word[1] != 'x') {
            for (const char digit : word) {
                if (digit < '0' || digit > '7') {
                    return false;
                }
                *value = *value << 3 | static_cast<u64>(digit - '0');
            }
            return *value <= most;
        }
        if (field.kind == FieldKind::kDate && word.find('-') != std::string_view::npos) {
            u32 date = 0;
            const bool isDate = ParseDate(std::string(word), &date);
            *value = date;
            return isDate;
        }
        return ParseNumber(word, most, value);
    }

    Problem ReadThreadName() {
        SkipBlanks();
        NameUnits units;
        if (!TakeQuoted(text_, &at_, Typed::kDecomposed, &units)) {
            const std::string_view word = TakeWord();
            if (word.empty() || !VELK::UnitsFromUtf8(word, &units)) {
                return Expected("a name");
            }
            units = DecomposedUnits(units);
        }
        if (units.size() > kCatalogKeys.longestName) {
            return Fault("the name has " + std::to_string(units.size()) +
                         " units, the longest has " + std::to_string(kCatalogKeys.longestName));
        }
        PutBe16(record_.data() + 8, static_cast<u32>(units.size()));
        threadName_.clear();
        for (const char16_t unit : units) {
            threadName_.push_back(static_cast<u8>(unit >> 8));
            threadName_.push_back(static_cast<u8>(unit));
        }
        return {};
    }

    void SumBlocks() {
        for (u32 i = 0; i < kind_->fieldCount; ++i) {
            const Field& field = kind_->fields[i];
            if (field.kind == FieldKind::kBlocks && (givenBlocks_ >> i & 1) == 0) {
                PutField(record_.data(), field,
                         SumOfExtents(record_.data() + field.offset + field.width));
            }
        }
    }

    std::string_view text_;
    u32 fileId_;
    const RecordKind* kind_ = nullptr;
    std::size_t at_ = 0;
    std::vector<u8> record_;
    std::vector<u8> threadName_;
    u64 givenBlocks_ = 0;  // bit i: field i was given
};

}  // namespace

Problem ParseData(std::string_view text, u32 fileId, RecordData* data) {
    *data = RecordData{};
    if (text == "same") {
        data->isSame = true;
        return {};
    }
    if (text.starts_with("hex:")) {
        return ParseHexBytes(text.substr(4), text.size() <= 20 ? text : "hex:...", &data->stored);
    }
    if (text.starts_with("@") && text.size() > 1) {
        return ReadWholeFile(text, &data->stored);
    }
    if (text.starts_with("fill:")) {
        return ReadFill(text, &data->stored);
    }
    if (text.starts_with("zero:") || text.starts_with("seq:")) {
        return ReadCounted(text, &data->stored);
    }
    if (text.find('{') == std::string_view::npos) {
        return DataProblem(text,
                           "expected hex:, @FILE, zero:N, fill:XX*N, seq:N, same or a record, for "
                           "example file{id:16}");
    }
    return RecordReader(text, fileId).Read(&data->stored);
}

}  // namespace VELK
