// See sample.h. The file holds the vectors one after the other, each with its length before it.
#include "sample.h"

#include <algorithm>
#include <cstdio>
#include <memory>

namespace bench {

namespace {

struct Closer {
    void operator()(std::FILE* file) const { std::fclose(file); }
};
using File = std::unique_ptr<std::FILE, Closer>;

template <typename T>
bool Write(std::FILE* file, const std::vector<T>& values) {
    const std::uint64_t count = values.size();
    return std::fwrite(&count, sizeof count, 1, file) == 1 &&
           std::fwrite(values.data(), sizeof(T), values.size(), file) == values.size();
}

template <typename T>
bool Read(std::FILE* file, std::vector<T>* values) {
    std::uint64_t count = 0;
    if (std::fread(&count, sizeof count, 1, file) != 1) {
        return false;
    }
    values->resize(count);
    return std::fread(values->data(), sizeof(T), count, file) == count;
}

}  // namespace

Sample TakeSample(const Workload& load, std::uint32_t count) {
    Sample sample;
    sample.origin = Shuffled(load.count, 19);
    sample.origin.resize(std::min(count, load.count));
    Workload* few = &sample.load;
    few->count = static_cast<std::uint32_t>(sample.origin.size());
    for (const std::uint32_t i : sample.origin) {
        const auto host = load.Host(i);
        const auto plain = load.Plain(i);
        few->hostAt.push_back(static_cast<std::uint32_t>(few->hostKeys.size()));
        few->hostKeys.insert(few->hostKeys.end(), host.begin(), host.end());
        few->plainAt.push_back(static_cast<std::uint32_t>(few->plainKeys.size()));
        few->plainKeys.insert(few->plainKeys.end(), plain.begin(), plain.end());
        few->parent.push_back(load.parent[i]);
        few->dataSize.push_back(load.dataSize[i]);
    }
    few->plainAt.push_back(static_cast<std::uint32_t>(few->plainKeys.size()));
    return sample;
}

bool WriteSample(const Sample& sample, const std::string& path) {
    const File file(std::fopen(path.c_str(), "wb"));
    const Workload& load = sample.load;
    return file != nullptr && Write(file.get(), sample.origin) &&
           Write(file.get(), load.hostKeys) && Write(file.get(), load.plainKeys) &&
           Write(file.get(), load.hostAt) && Write(file.get(), load.plainAt) &&
           Write(file.get(), load.parent) && Write(file.get(), load.dataSize) &&
           std::fflush(file.get()) == 0;
}

bool ReadSample(const std::string& path, Sample* sample) {
    const File file(std::fopen(path.c_str(), "rb"));
    Workload* load = &sample->load;
    const bool isRead = file != nullptr && Read(file.get(), &sample->origin) &&
                        Read(file.get(), &load->hostKeys) && Read(file.get(), &load->plainKeys) &&
                        Read(file.get(), &load->hostAt) && Read(file.get(), &load->plainAt) &&
                        Read(file.get(), &load->parent) && Read(file.get(), &load->dataSize);
    load->count = static_cast<std::uint32_t>(sample->origin.size());
    return isRead;
}

}  // namespace bench
