// Writes the language-0 Lab kernel text to a file, so that the colour tests can compile it as host C++.
#include "host/raster/LabFragments.h"

#include <cstdio>

int main(int argc, char** argv) {
    if (argc != 2) {
        std::fprintf(stderr, "usage: lab_fragment_dump OUTPUT\n");
        return 2;
    }
    const char* text = Raster::GetLabConversionFragment(0);
    std::FILE* file = std::fopen(argv[1], "w");
    if (!text || !file) {
        std::fprintf(stderr, "lab_fragment_dump: cannot write %s\n", argv[1]);
        return 1;
    }
    const bool written = std::fputs(text, file) >= 0;
    return std::fclose(file) == 0 && written ? 0 : 1;
}
