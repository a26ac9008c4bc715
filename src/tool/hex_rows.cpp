// Rows of bytes.
#include "tool/hex_rows.h"

#include <cstring>
#include <string>

namespace VELK::tool {

void WriteHexRows(Output* out, const u8* bytes, std::size_t size, u64 base, u32 indent) {
    constexpr std::size_t kRow = 16;
    bool starred = false;
    for (std::size_t at = 0; at < size; at += kRow) {
        const bool repeats =
            at != 0 && at + kRow < size && std::memcmp(bytes + at, bytes + at - kRow, kRow) == 0;
        if (repeats) {
            out->Write(starred ? "" : std::string(indent, ' ') + "*\n");
            starred = true;
            continue;
        }
        starred = false;
        std::string row = fmt::format("{:{}}0x{:04x} ", "", indent, base + at);
        std::string text;
        for (std::size_t i = 0; i < kRow; ++i) {
            if (at + i >= size) {
                row += "   ";
                continue;
            }
            const u8 byte = bytes[at + i];
            row += fmt::format("{}{:02x}", i == kRow / 2 ? "  " : " ", byte);
            text.push_back(byte >= 0x20 && byte < 0x7F ? static_cast<char>(byte) : '.');
        }
        if (size - at <= kRow / 2) {
            row += " ";
        }
        out->Print("{}  {}\n", row, text);
    }
}

}  // namespace VELK::tool
