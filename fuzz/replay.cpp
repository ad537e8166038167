// A libFuzzer program for the target that the build names; without that, a program that runs the files of folders
// through the target named on the command line.

#include "judge.h"

#include <cstdio>
#include <cstring>
#include <filesystem>
#include <fstream>
#include <iterator>

using namespace flvd_fuzz;

static const Target* find(const char* name)
{
    const Target* target = Target::first;
    while (target != nullptr && std::strcmp(target->name, name) != 0)
        target = target->next;
    return target;
}

#ifdef FLVDMX_FUZZ_TARGET
extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size)
{
    static const Target* const target = find(FLVDMX_FUZZ_TARGET);
    Input input(data, size);
    target->run(input);
    return 0;
}
#else
int main(int argc, char** argv)
{
    const Target* const target = argc > 1 ? find(argv[1]) : nullptr;
    size_t count = 0;
    for (int i = 2; target != nullptr && i < argc; ++i) {
        for (const auto& entry : std::filesystem::directory_iterator(argv[i])) {
            std::printf("%s\n", entry.path().c_str());
            std::fflush(stdout); // the last name printed is that of the file that ended the process
            std::ifstream stream(entry.path(), std::ios::binary);
            const Bytes bytes{std::istreambuf_iterator<char>(stream), {}};
            Input input(bytes.data(), bytes.size());
            target->run(input);
            ++count;
        }
    }
    return count != 0 ? 0 : 1; // a wrong name or empty folders are no success
}
#endif
