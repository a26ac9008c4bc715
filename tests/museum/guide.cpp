// What the museum can be asked for:
//   museum_guide document        docs/damage.md, from what is said of the exhibits now
//   museum_guide record [NAME]   what is said of the exhibits whose name contains NAME, as it is
//   now museum_guide images FOLDER   the images as files, and their names
#include <cstdio>
#include <cstring>
#include <fstream>

#include "document.h"

namespace {

using namespace VELK::test;

void Record(const char* part) {
    for (const Hall& hall : Museum()) {
        for (const Exhibit& exhibit : hall.exhibits) {
            if (std::strstr(exhibit.name, part) == nullptr) {
                continue;
            }
            const Shown shown = Show(exhibit);
            std::printf("%s\n%s", exhibit.name, LabelOf(exhibit, shown).c_str());
            if (!shown.fault.empty()) {
                std::printf("  FAULT %s\n", shown.fault.c_str());
            }
        }
    }
}

void WriteImages(const std::string& folder) {
    for (const Hall& hall : Museum()) {
        for (const Exhibit& exhibit : hall.exhibits) {
            const Bytes image = MakeImage(exhibit);
            std::ofstream file(folder + "/" + exhibit.name + ".img", std::ios::binary);
            file.write(reinterpret_cast<const char*>(image.data()),
                       static_cast<std::streamsize>(image.size()));
            std::printf("%s\n", exhibit.name);
        }
    }
}

}  // namespace

int main(int argc, char** argv) {
    const std::string word = argc > 1 ? argv[1] : "";
    if (word == "document") {
        std::fputs(Document().c_str(), stdout);
    } else if (word == "record") {
        Record(argc > 2 ? argv[2] : "");
    } else if (word == "images" && argc > 2) {
        WriteImages(argv[2]);
    } else {
        std::fputs("usage: museum_guide document | record [NAME] | images FOLDER\n", stderr);
        return 2;
    }
    return 0;
}
