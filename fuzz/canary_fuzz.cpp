// Fails on purpose, on an input that begins with "bird": the proof that a wrong answer in any other
// target would be seen.
#include "fuzz.h"

extern "C" int LLVMFuzzerTestOneInput(const VELK::u8* data, std::size_t size) {
    const char bird[] = {'b', 'i', 'r', 'd'};
    std::size_t alike = 0;
    while (alike < sizeof bird && alike < size &&
           data[alike] == static_cast<VELK::u8>(bird[alike])) {
        alike += 1;
    }
    FUZZ_CHECK(alike < sizeof bird);
    return 0;
}
