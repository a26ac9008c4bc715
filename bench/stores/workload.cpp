// See workload.h.
#include "workload.h"

#include <algorithm>
#include <cmath>
#include <cstring>
#include <numeric>
#include <random>

namespace bench {

namespace {

// Sizes of the folders: falling as rank^-0.7, adding up to `count`.
std::vector<std::uint32_t> FolderSizes(std::uint32_t count, std::uint32_t folders) {
    double sum = 0;
    for (std::uint32_t rank = 1; rank <= folders; ++rank) {
        sum += std::pow(rank, -0.7);
    }
    std::vector<std::uint32_t> sizes(folders);
    std::uint32_t left = count;
    for (std::uint32_t rank = 1; rank <= folders; ++rank) {
        const double share = std::pow(rank, -0.7) / sum * count;
        sizes[rank - 1] = std::min(left, static_cast<std::uint32_t>(share));
        left -= sizes[rank - 1];
    }
    for (std::uint32_t i = 0; left > 0; i = (i + 1) % folders, --left) {
        sizes[i] += 1;
    }
    return sizes;
}

// A name of 4 to 40 units ending in `number`, so that names of one folder differ even when case
// is folded; one in twenty holds units beyond ASCII.
std::vector<std::uint16_t> MakeName(std::mt19937_64& random, std::uint32_t number) {
    constexpr char kLetters[] = "aAbcdDeEfghiIjklmMnoOpqrRsStTuvwxyz  __-.0123456789";
    std::uint16_t digits[8];
    int digitCount = 0;
    for (std::uint32_t rest = number; rest != 0 || digitCount == 0; rest /= 36) {
        const std::uint32_t digit = rest % 36;
        digits[digitCount++] =
            static_cast<std::uint16_t>(digit < 10 ? '0' + digit : 'a' + digit - 10);
    }
    // Mean 16.5 units, so that keys have 39 bytes in the mean.
    const std::uint32_t spread = static_cast<std::uint32_t>(random() % 26);
    std::uint32_t length =
        4 + (random() % 20 == 0 ? static_cast<std::uint32_t>(random() % 37) : spread);
    length = std::max<std::uint32_t>(length, static_cast<std::uint32_t>(digitCount));
    const bool foreign = random() % 20 == 0;
    std::vector<std::uint16_t> name;
    while (name.size() + static_cast<std::size_t>(digitCount) < length) {
        const std::uint64_t ticket = random();
        name.push_back(
            foreign && ticket % 3 == 0
                ? static_cast<std::uint16_t>(0x4E00 + ticket / 3 % 2000)
                : static_cast<std::uint16_t>(kLetters[ticket / 3 % (sizeof kLetters - 1)]));
    }
    // The number is closed off from letters before it, so "a" + "b1" and "ab" + "1" cannot meet.
    if (!name.empty()) {
        name.back() = '~';
    }
    name.insert(name.end(), digits, digits + digitCount);
    return name;
}

void AddKey(Workload* load, std::uint32_t parent, const std::vector<std::uint16_t>& name) {
    const std::uint16_t units = static_cast<std::uint16_t>(name.size());
    const std::uint16_t keyLength = static_cast<std::uint16_t>(6 + 2 * units);
    load->hostAt.push_back(static_cast<std::uint32_t>(load->hostKeys.size()));
    load->hostKeys.resize(load->hostKeys.size() + (8u + 2u * units + 7u) / 8 * 8);
    std::uint8_t* host = load->hostKeys.data() + load->hostAt.back();
    std::memcpy(host, &keyLength, 2);
    std::memcpy(host + 2, &parent, 4);
    std::memcpy(host + 6, &units, 2);
    std::memcpy(host + 8, name.data(), 2u * units);

    load->plainAt.push_back(static_cast<std::uint32_t>(load->plainKeys.size()));
    for (int shift = 24; shift >= 0; shift -= 8) {
        load->plainKeys.push_back(static_cast<std::uint8_t>(parent >> shift));
    }
    for (const std::uint16_t unit : name) {
        load->plainKeys.push_back(static_cast<std::uint8_t>(unit >> 8));
        load->plainKeys.push_back(static_cast<std::uint8_t>(unit));
    }
    load->parent.push_back(parent);
}

std::uint16_t PickSize(std::mt19937_64& random) {
    const std::uint64_t ticket = random() % 100;
    if (ticket < 70) {
        return 248;
    }
    return ticket < 90 ? 88 : static_cast<std::uint16_t>(kLeastData + random() % 256 * 2);
}

}  // namespace

Workload MakeWorkload(std::uint32_t count, std::uint64_t seed) {
    std::mt19937_64 random(seed);
    Workload load;
    load.count = count;
    load.folders = std::max<std::uint32_t>(1, count / 16);
    load.folderSize = FolderSizes(count, load.folders);
    load.hostKeys.reserve(std::size_t{count} * 48);
    load.plainKeys.reserve(std::size_t{count} * 40);
    for (std::uint32_t folder = 0; folder < load.folders; ++folder) {
        for (std::uint32_t i = 0; i < load.folderSize[folder]; ++i) {
            AddKey(&load, kFirstParent + folder, MakeName(random, i));
            load.dataSize.push_back(PickSize(random));
        }
    }
    load.plainAt.push_back(static_cast<std::uint32_t>(load.plainKeys.size()));
    return load;
}

void Batch::Fill(const Workload& load, std::span<const std::uint32_t> numbers,
                 std::uint32_t version) {
    constexpr std::size_t kWord = sizeof room_[0];
    records_.clear();
    room_.resize(numbers.size() * ((2 * kLargestKey + kLargestData) / kWord));
    std::uint8_t* room = reinterpret_cast<std::uint8_t*>(room_.data());
    const auto take = [&room](std::size_t bytes) {
        std::uint8_t* place = room;
        room += (bytes + kWord - 1) / kWord * kWord;
        return place;
    };
    const auto copy = [&take](std::span<const std::uint8_t> bytes) {
        std::uint8_t* place = take(bytes.size());
        std::memcpy(place, bytes.data(), bytes.size());
        return place;
    };
    for (const std::uint32_t i : numbers) {
        const auto plain = load.Plain(i);
        Record record = {
            copy(load.Host(i)), {copy(plain), plain.size()}, nullptr, load.dataSize[i]};
        if (version != kKeysOnly) {
            std::uint8_t* data = take(record.size);
            MakeData(i, version, record.size, data);
            record.data = data;
        }
        records_.push_back(record);
    }
}

void MakeData(std::uint32_t i, std::uint32_t version, std::uint32_t size, std::uint8_t* out) {
    std::uint64_t word = (std::uint64_t{i} << 32 | version) * 0x9E3779B97F4A7C15u + 1;
    for (std::uint32_t at = 0; at < size; at += 8) {
        std::memcpy(out + at, &word, std::min<std::uint32_t>(8, size - at));
        word += 0x9E3779B97F4A7C15u;
    }
}

std::uint64_t Digest::All(const std::uint8_t* data, std::size_t size) {
    std::uint64_t sum = size;
    std::size_t at = 0;
    for (; at + 8 <= size; at += 8) {
        std::uint64_t word;
        std::memcpy(&word, data + at, 8);
        sum += word;
    }
    for (; at < size; ++at) {
        sum += data[at];
    }
    return sum;
}

std::vector<std::uint32_t> Shuffled(std::uint32_t count, std::uint64_t seed) {
    std::vector<std::uint32_t> order(count);
    std::iota(order.begin(), order.end(), 0u);
    std::shuffle(order.begin(), order.end(), std::mt19937_64(seed));
    return order;
}

}  // namespace bench
