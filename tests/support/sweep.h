/* What is left of an exhaustive sweep when there is little time. */
#pragma once

#include <algorithm>
#include <cstdint>
#include <cstdlib>

namespace flvd_test {

/**
 * The cases of one sweep, counted. A run takes all of them; with FLVDMX_SAMPLE=N in the environment it takes the first
 * and every Nth after it, always the same ones. N should have no factor in common with what a sweep takes in turn.
 */
class Sweep {
public:
    /** Asked once before each case: whether to run it. */
    bool takes_next() { return m_cases++ % step() == 0; }
    /** Without a sample: what all cases together have to show can be tested. */
    static bool is_complete() { return step() == 1; }

private:
    static uint64_t step()
    {
        static const char* const sample = std::getenv("FLVDMX_SAMPLE");
        return sample != nullptr ? std::max<uint64_t>(std::strtoull(sample, nullptr, 10), 1) : 1;
    }

    uint64_t m_cases = 0;
};

} // namespace flvd_test
