#include "sweep.h"

#include <algorithm>
#include <cstdlib>

namespace flvd_test {

uint64_t Sweep::step()
{
    static const char* const sample = std::getenv("FLVDMX_SAMPLE");
    static const uint64_t every = sample != nullptr ? std::strtoull(sample, nullptr, 10) : 1;
    return std::max<uint64_t>(every, 1);
}

} // namespace flvd_test
