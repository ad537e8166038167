/* Runs only a sample of an exhaustive sweep when there is little time. */
#pragma once

#include <algorithm>
#include <cstdint>
#include <cstdlib>

namespace flvd_test {

/**
 * Counts the cases of one sweep. By default all are run. With FLVDMX_SAMPLE=N in the environment, the first and every
 * Nth after it are run, always the same ones. N should have no common factor with the number of options that a sweep
 * uses in turn.
 */
class Sweep {
public:
    /** Call it once before each case. Returns whether to run it. */
    bool takes_next() { return m_cases++ % step() == 0; }
    /** True if all cases are run, so that their combined result can be checked. */
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
