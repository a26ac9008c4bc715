// JSON text, piece by piece.
#include "hfs/records/json_writer.h"

#include "hfs/records/name_text.h"
#include "hfs/volume/problem.h"

namespace VELK {

void JsonWriter::Separate() {
    if (needsComma_) {
        out_->push_back(',');
    }
    needsComma_ = true;
}

void JsonWriter::Open(char bracket) {
    Separate();
    out_->push_back(bracket);
    needsComma_ = false;
}

void JsonWriter::Close(char bracket) {
    out_->push_back(bracket);
    needsComma_ = true;
}

void JsonWriter::Key(std::string_view name) {
    Value(name);
    out_->push_back(':');
    needsComma_ = false;
}

void JsonWriter::Value(std::string_view text) {
    Separate();
    out_->push_back('"');
    AppendJsonText(out_, text);
    out_->push_back('"');
}

void JsonWriter::Value(double value) {
    Raw(Format("%.6g", value));
}

void JsonWriter::EscapedString(std::string_view escaped) {
    Separate();
    out_->push_back('"');
    out_->append(escaped);
    out_->push_back('"');
}

void JsonWriter::Raw(std::string_view value) {
    Separate();
    out_->append(value);
}

}  // namespace VELK
