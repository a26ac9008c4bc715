// Where a command's result goes: standard output, or a file that appears only when the command has
// succeeded. One large buffer; nothing is allocated per line.
#pragma once

#include <fmt/format.h>

#include <iterator>
#include <memory>
#include <string>
#include <string_view>

#include "platform/types.h"

namespace VELK::tool {

class Output {
public:
    Output();
    Output(const Output&) = delete;
    Output& operator=(const Output&) = delete;
    ~Output();  // without Commit, a file is not left behind

    // Sends everything to `path`, written under another name until Commit. Refuses a file that
    // exists (unless `replace`) and the image that is being read.
    void OpenFile(const std::string& path, const std::string& image, bool replace);

    void Write(std::string_view text);
    template <typename... Args>
    void Print(fmt::format_string<Args...> format, Args&&... args) {
        scratch_.clear();
        fmt::format_to(std::back_inserter(scratch_), format, std::forward<Args>(args)...);
        Write({scratch_.data(), scratch_.size()});
    }
    // Room for `bytes` bytes to be written in place; Used tells where they end.
    char* Room(std::size_t bytes) {
        if (kBufferSize - used_ < bytes) {
            Flush();
        }
        return buffer_.get() + used_;
    }
    void Used(const char* end) { used_ = static_cast<std::size_t>(end - buffer_.get()); }

    void Flush();
    // Flushes and gives the file its name.
    void Commit();
    // True when the result goes to a terminal.
    bool IsTerminal() const;

    static constexpr std::size_t kBufferSize = std::size_t{1} << 17;

private:
    void WriteAll(const char* bytes, std::size_t size);

    std::unique_ptr<char[]> buffer_;
    std::size_t used_ = 0;
    int fd_ = 1;
    std::string path_;
    std::string partPath_;
    bool replace_ = false;
    fmt::memory_buffer scratch_;
};

}  // namespace VELK::tool
