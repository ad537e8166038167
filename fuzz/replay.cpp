// With FLVDMX_FUZZ_TARGET, the libFuzzer program of that target. Without it, a program that runs the files of folders
// through the target named on the command line.

#include "harness.h"

#include <cstdio>
#include <filesystem>
#include <fstream>
#include <iterator>

using namespace flvd_fuzz;

#ifdef FLVDMX_FUZZ_TARGET
extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size)
{
    static const auto run = Target::all.at(FLVDMX_FUZZ_TARGET);
    Input input(data, size);
    run(input);
    return 0;
}
#else
int main(int argc, char** argv)
{
    const auto run = argc > 1 ? Target::all[argv[1]] : nullptr;
    size_t count = 0;
    for (int i = 2; run != nullptr && i < argc; ++i) {
        for (const auto& entry : std::filesystem::directory_iterator(argv[i])) {
            std::printf("%s\n", entry.path().c_str());
            std::fflush(stdout); // if the process aborts, the last name printed is that of the file
            std::ifstream stream(entry.path(), std::ios::binary);
            const Bytes bytes{std::istreambuf_iterator<char>(stream), {}};
            Input input(bytes.data(), bytes.size());
            run(input);
            ++count;
        }
    }
    return count != 0 ? 0 : 1; // a wrong name or empty folders count as failure
}
#endif
